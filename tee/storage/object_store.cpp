#include "tee/storage/object_store.h"

#include <algorithm>
#include <array>

#include "tee/crypto/algorithms.h"

namespace hosted_tee {
namespace {

constexpr const char* schema =
    "CREATE TABLE IF NOT EXISTS objects (ta BLOB NOT NULL, id BLOB NOT NULL, sealed BLOB NOT NULL,"
    " PRIMARY KEY (ta, id)) WITHOUT ROWID;"
    "CREATE TABLE IF NOT EXISTS written (times INTEGER NOT NULL);"
    "INSERT INTO written SELECT 0 WHERE NOT EXISTS (SELECT 1 FROM written)";

std::span<const std::uint8_t> bytes_of(const std::string& text) {
  return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

statement keyed(database& db, const char* sql, const object_key& key) {
  statement s(db, sql);
  s.bind(1, key.ta).bind(2, bytes_of(key.id));
  return s;
}

class digester {
 public:
  digester() : context_(owned<evp_digest_context>(EVP_MD_CTX_new())) {
    const EVP_MD* const sha256 = fetched_digest(digest_kind::sha256);
    if (EVP_DigestInit_ex2(context_.get(), sha256, nullptr) != 1) throw call_failure(TEE_ERROR_GENERIC);
  }

  // Each part goes in behind its length, so that no two contents digest the same bytes.
  void add(std::span<const std::uint8_t> part) {
    add_number(part.size());
    EVP_DigestUpdate(context_.get(), part.data(), part.size());
  }
  void add_number(std::uint64_t number) {
    std::array<std::uint8_t, 8> bytes{};
    for (unsigned i = 0; i < 8; ++i) bytes[i] = static_cast<std::uint8_t>(number >> (8 * i));
    EVP_DigestUpdate(context_.get(), bytes.data(), bytes.size());
  }
  [[nodiscard]] std::array<std::uint8_t, 32> finish() {
    std::array<std::uint8_t, 32> digest{};
    if (EVP_DigestFinal_ex(context_.get(), digest.data(), nullptr) != 1) throw call_failure(TEE_ERROR_GENERIC);
    return digest;
  }

 private:
  evp_digest_context context_;
};

std::filesystem::path counter_file(const std::filesystem::path& folder, const store_options& options) {
  return folder / (options.name + ".counter");
}

}  // namespace

object_store::object_store(const std::filesystem::path& folder, const storage_key& key, store_options options)
    : options_(std::move(options)), sealer_(key) {
  const std::filesystem::path file = folder / (options_.name + ".db");
  if (!options_.detects_rollback) {
    open_database(file);
    return;
  }
  guard_.emplace(counter_file(folder, options_), key, options_.step);
  try {
    open_database(file);
    rolled_back_ = !guard_->accept(current_state());
  } catch (const call_failure& failure) {
    if (failure.code() != TEE_ERROR_CORRUPT_OBJECT && failure.code() != TEE_ERROR_SECURITY) throw;
    rolled_back_ = true;
  }
}

void object_store::prepare(const std::filesystem::path& folder, const storage_key& key, const store_options& options) {
  database_state empty;
  digester digest;
  digest.add_number(empty.counter);
  empty.digest = digest.finish();
  rollback_guard(counter_file(folder, options), key, options.step).start(empty);
}

void object_store::open_database(const std::filesystem::path& file) {
  reached(":open");
  db_ = std::make_unique<database>(file);
  transaction make(*db_);
  db_->execute(schema);
  make.commit();
  reached(":opened");
}

void object_store::reached(const char* step) const {
  if (options_.step) options_.step(options_.name + step);
}

void object_store::require_usable() const {
  if (rolled_back_) throw call_failure(TEE_ERROR_STORAGE_NOT_AVAILABLE);
}

TEE_Result object_store::check() {
  if (rolled_back_) return TEE_ERROR_SECURITY;
  if (guard_ && !guard_->is_settled_at(current_state())) rolled_back_ = true;
  return rolled_back_ ? TEE_ERROR_SECURITY : TEE_SUCCESS;
}

database_state object_store::current_state() {
  database_state state;
  statement counter(*db_, "SELECT times FROM written");
  if (counter.step()) state.counter = static_cast<std::uint64_t>(counter.number(0));
  digester digest;
  digest.add_number(state.counter);
  statement rows(*db_, "SELECT ta, id, sealed FROM objects ORDER BY ta, id");
  while (rows.step()) {
    for (int column = 0; column < 3; ++column) digest.add(rows.bytes(column));
  }
  state.digest = digest.finish();
  return state;
}

// A label ends in the identifier, the one part whose length varies.
std::string object_store::label(const object_key& key) const {
  std::string text = options_.name + '\0';
  text.append(key.ta.begin(), key.ta.end());
  return text.append(key.id);
}

std::optional<secret_bytes> object_store::read(const object_key& key) {
  require_usable();
  statement row = keyed(*db_, "SELECT sealed FROM objects WHERE ta = ?1 AND id = ?2", key);
  if (!row.step()) return std::nullopt;
  std::optional<secret_bytes> data = sealer_.open(label(key), row.bytes(0));
  if (!data) throw call_failure(TEE_ERROR_CORRUPT_OBJECT);
  return data;
}

std::optional<std::uint32_t> object_store::size(const object_key& key) {
  require_usable();
  statement row = keyed(*db_, "SELECT length(sealed) FROM objects WHERE ta = ?1 AND id = ?2", key);
  if (!row.step()) return std::nullopt;
  if (row.number(0) < sealer::overhead) throw call_failure(TEE_ERROR_CORRUPT_OBJECT);
  return static_cast<std::uint32_t>(row.number(0) - sealer::overhead);
}

bool object_store::contains(const object_key& key) {
  require_usable();
  return keyed(*db_, "SELECT 1 FROM objects WHERE ta = ?1 AND id = ?2", key).step();
}

void object_store::change(const std::function<void()>& statements) {
  require_usable();
  reached(":begin");
  transaction write(*db_);
  statements();
  db_->execute("UPDATE written SET times = times + 1");
  std::optional<database_state> next;
  if (guard_) {
    next = current_state();
    guard_->announce(*next);
  }
  reached(":commit");
  write.commit();
  reached(":committed");
  if (guard_) guard_->settle(*next);
}

void object_store::insert(const object_key& key, std::span<const std::uint8_t> data) {
  const std::vector<std::uint8_t> sealed = sealer_.seal(label(key), data);
  keyed(*db_, "INSERT OR REPLACE INTO objects VALUES (?1, ?2, ?3)", key).bind(3, sealed).run();
}

void object_store::erase(const object_key& key) {
  keyed(*db_, "DELETE FROM objects WHERE ta = ?1 AND id = ?2", key).run();
}

void object_store::write(const object_key& key, std::span<const std::uint8_t> data) {
  if (data.size() > max_object_size) throw call_failure(TEE_ERROR_STORAGE_NO_SPACE);
  change([&] { insert(key, data); });
}

void object_store::remove(const object_key& key) {
  change([&] { erase(key); });
}

// The identifier is part of what the seal covers, so the object is sealed anew.
void object_store::rename(const object_key& from, const std::string& new_id) {
  const std::optional<secret_bytes> data = read(from);
  if (!data) throw call_failure(TEE_ERROR_ITEM_NOT_FOUND);
  change([&] {
    erase(from);
    insert({from.ta, new_id}, *data);
  });
}

std::vector<std::uint32_t> object_store::handles_on(const object_key& key) const {
  const auto handles = open_handles_.find(key);
  return handles == open_handles_.end() ? std::vector<std::uint32_t>{} : handles->second;
}

void object_store::forget_handle(const object_key& key, std::uint32_t flags) {
  const auto handles = open_handles_.find(key);
  if (handles == open_handles_.end()) return;
  const auto gone = std::find(handles->second.begin(), handles->second.end(), flags);
  if (gone != handles->second.end()) handles->second.erase(gone);
  if (handles->second.empty()) open_handles_.erase(handles);
}

}  // namespace hosted_tee
