#include "tee/storage/database.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <utility>

namespace hosted_tee {
namespace {

constexpr std::array<std::pair<int, TEE_Result>, 5> results{{
    {SQLITE_FULL, TEE_ERROR_STORAGE_NO_SPACE},
    {SQLITE_TOOBIG, TEE_ERROR_STORAGE_NO_SPACE},
    {SQLITE_NOMEM, TEE_ERROR_OUT_OF_MEMORY},
    {SQLITE_CORRUPT, TEE_ERROR_CORRUPT_OBJECT},
    {SQLITE_NOTADB, TEE_ERROR_CORRUPT_OBJECT},
}};

TEE_Result result_of(int sqlite_code) {
  for (const auto& [code, result] : results) {
    if ((sqlite_code & 0xFF) == code) return result;
  }
  return TEE_ERROR_STORAGE_NOT_AVAILABLE;
}

void require(sqlite3* connection, int code) {
  if (code != SQLITE_OK) throw database_failure(code, sqlite3_errmsg(connection));
}

}  // namespace

database_failure::database_failure(int sqlite_code, const char* message)
    : call_failure(result_of(sqlite_code)),
      message_(message),
      damaged_(result_of(sqlite_code) == TEE_ERROR_CORRUPT_OBJECT) {}

database::database(const std::filesystem::path& file) {
  // SQLite would make it readable for everybody, as far as the umask lets it.
  const int made = ::open(file.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
  if (made < 0) throw database_failure(SQLITE_CANTOPEN, "the database file can't be opened");
  ::close(made);
  sqlite3* connection = nullptr;
  const int code = sqlite3_open_v2(file.c_str(), &connection, SQLITE_OPEN_READWRITE, nullptr);
  connection_.reset(connection);
  require(connection, code);
  // The journal is emptied rather than deleted: with synchronous=FULL that, too, is on the disk when COMMIT returns,
  // so no later power failure can take a finished transaction back.
  execute("PRAGMA locking_mode=EXCLUSIVE; PRAGMA journal_mode=TRUNCATE; PRAGMA synchronous=FULL");
  execute("PRAGMA trusted_schema=OFF");
}

void database::execute(const char* sql) {
  require(connection_.get(), sqlite3_exec(connection_.get(), sql, nullptr, nullptr, nullptr));
}

statement::statement(database& db, const char* sql) : connection_(db.connection()) {
  sqlite3_stmt* prepared = nullptr;
  require(connection_, sqlite3_prepare_v2(connection_, sql, -1, &prepared, nullptr));
  statement_.reset(prepared);
}

statement& statement::bind(int at, std::span<const std::uint8_t> bytes) {
  // A null pointer would bind NULL; an empty object is an empty blob.
  const void* data = bytes.empty() ? static_cast<const void*>("") : bytes.data();
  require(connection_, sqlite3_bind_blob64(statement_.get(), at, data, bytes.size(), SQLITE_STATIC));
  return *this;
}

statement& statement::bind(int at, std::int64_t number) {
  require(connection_, sqlite3_bind_int64(statement_.get(), at, number));
  return *this;
}

bool statement::step() {
  const int code = sqlite3_step(statement_.get());
  if (code == SQLITE_ROW) return true;
  if (code != SQLITE_DONE) throw database_failure(code, sqlite3_errmsg(connection_));
  return false;
}

std::span<const std::uint8_t> statement::bytes(int column) const {
  const auto* data = static_cast<const std::uint8_t*>(sqlite3_column_blob(statement_.get(), column));
  return {data, data == nullptr ? 0 : static_cast<std::size_t>(sqlite3_column_bytes(statement_.get(), column))};
}

transaction::~transaction() {
  // SQLite has rolled back by itself after some errors; what this answers then does not matter.
  if (open_) sqlite3_exec(db_.connection(), "ROLLBACK", nullptr, nullptr, nullptr);
}

}  // namespace hosted_tee
