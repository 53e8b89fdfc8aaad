// SQLite, as far as the stores need it: owners, and errors as exceptions.
#ifndef TEE_STORAGE_DATABASE_H_
#define TEE_STORAGE_DATABASE_H_

#include <sqlite3.h>

#include <cstdint>
#include <filesystem>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "tee/runtime/platform_call.h"

namespace hosted_tee {

/// What SQLite reported: the result that a TA sees, and whether the file itself is damaged.
class database_failure : public call_failure {
 public:
  database_failure(int sqlite_code, const char* message);
  [[nodiscard]] bool damaged() const { return damaged_; }
  [[nodiscard]] const char* what() const noexcept override { return message_.c_str(); }

 private:
  std::string message_;
  bool damaged_;
};

/// One connection: alone on its file, every commit on the disk before it returns.
class database {
 public:
  /// Opens `file`, making it (mode 0600) when it is missing. Throws database_failure.
  explicit database(const std::filesystem::path& file);

  void execute(const char* sql);
  [[nodiscard]] sqlite3* connection() const { return connection_.get(); }

 private:
  struct closer {
    void operator()(sqlite3* connection) const { sqlite3_close_v2(connection); }
  };
  std::unique_ptr<sqlite3, closer> connection_;
};

/// One SQL statement. Parameters count from 1, columns from 0, as in SQLite. Bound bytes are not copied: they must
/// live until the statement has run.
class statement {
 public:
  statement(database& db, const char* sql);

  statement& bind(int at, std::span<const std::uint8_t> bytes);
  statement& bind(int at, std::int64_t number);

  /// step answers whether there is a row; throws database_failure.
  [[nodiscard]] bool step();
  void run() {
    while (step()) {
    }
  }

  /// A column's bytes, valid until the next step.
  [[nodiscard]] std::span<const std::uint8_t> bytes(int column) const;
  [[nodiscard]] std::int64_t number(int column) const { return sqlite3_column_int64(statement_.get(), column); }

 private:
  struct finalizer {
    void operator()(sqlite3_stmt* s) const { sqlite3_finalize(s); }
  };
  sqlite3* connection_;
  std::unique_ptr<sqlite3_stmt, finalizer> statement_;
};

/// Rolls back unless it was committed.
class transaction {
 public:
  explicit transaction(database& db) : db_(db) { db_.execute("BEGIN IMMEDIATE"); }
  ~transaction();
  transaction(const transaction&) = delete;
  transaction& operator=(const transaction&) = delete;

  void commit() {
    db_.execute("COMMIT");
    open_ = false;
  }

 private:
  database& db_;
  bool open_ = true;
};

}  // namespace hosted_tee

#endif  // TEE_STORAGE_DATABASE_H_
