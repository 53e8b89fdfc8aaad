// One persistent storage of the device: objects by TA and identifier, sealed, in one SQLite file.
#ifndef TEE_STORAGE_OBJECT_STORE_H_
#define TEE_STORAGE_OBJECT_STORE_H_

#include <compare>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "tee/runtime/uuid.h"
#include "tee/storage/database.h"
#include "tee/storage/rollback_guard.h"
#include "tee/storage/sealing.h"

namespace hosted_tee {

/// Whose object, and which. Each TA has a name space of its own.
struct object_key {
  uuid_bytes ta;
  std::string id;

  friend auto operator<=>(const object_key&, const object_key&) = default;
};

/// The name space of the platform's own records, which no TA can have: the nil UUID.
inline constexpr uuid_bytes platform_name_space{};

/// What makes one store differ from the other.
struct store_options {
  std::string name;  ///< of its files ("<name>.db", "<name>.counter"), its steps and its labels
  bool detects_rollback = false;
  step_observer step;
};

/// Every change is one transaction, on the disk when the call returns. Failures are thrown as call_failure:
/// TEE_ERROR_CORRUPT_OBJECT (a row does not authenticate, or the file is damaged), TEE_ERROR_STORAGE_NO_SPACE,
/// TEE_ERROR_STORAGE_NOT_AVAILABLE (also: this store was found to be rolled back).
class object_store {
 public:
  static constexpr std::uint32_t max_object_size = 64U << 20;

  /// Opens or makes the store in `folder`. A store that detects rollback opens whatever it finds, and tells through
  /// check(); any other throws database_failure when its file is damaged.
  object_store(const std::filesystem::path& folder, const storage_key& key, store_options options);

  /// prepare writes what a store that detects rollback needs to find when it is opened for the first time: without it,
  /// or after it was deleted, such a store is taken for a rolled back one. For a device that is being made.
  static void prepare(const std::filesystem::path& folder, const storage_key& key, const store_options& options);

  /// check answers TEE_SUCCESS, or TEE_ERROR_SECURITY when the content is not the latest that this device wrote.
  [[nodiscard]] TEE_Result check();

  [[nodiscard]] std::optional<secret_bytes> read(const object_key& key);   ///< nothing: absent
  [[nodiscard]] std::optional<std::uint32_t> size(const object_key& key);  ///< of the data; nothing: absent
  [[nodiscard]] bool contains(const object_key& key);                      ///< also when it is corrupt
  void write(const object_key& key, std::span<const std::uint8_t> data);   ///< creates or replaces
  void remove(const object_key& key);
  void rename(const object_key& from, const std::string& new_id);  ///< the new identifier must be free

  /// Flags of the handles that are open on an object, in this whole device: the sharing rules look at all of them.
  [[nodiscard]] std::vector<std::uint32_t> handles_on(const object_key& key) const;
  void add_handle(const object_key& key, std::uint32_t flags) { open_handles_[key].push_back(flags); }
  void forget_handle(const object_key& key, std::uint32_t flags);

 private:
  void open_database(const std::filesystem::path& file);
  void require_usable() const;
  void reached(const char* step) const;
  [[nodiscard]] database_state current_state();
  void change(const std::function<void()>& statements);
  void insert(const object_key& key, std::span<const std::uint8_t> data);
  void erase(const object_key& key);
  [[nodiscard]] std::string label(const object_key& key) const;

  store_options options_;
  sealer sealer_;
  std::unique_ptr<database> db_;
  std::optional<rollback_guard> guard_;
  bool rolled_back_ = false;
  std::map<object_key, std::vector<std::uint32_t>> open_handles_;
};

}  // namespace hosted_tee

#endif  // TEE_STORAGE_OBJECT_STORE_H_
