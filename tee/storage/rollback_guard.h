// What stands in for the RPMB's write counter: a small authenticated file that knows which state of the database is the
// latest.
#ifndef TEE_STORAGE_ROLLBACK_GUARD_H_
#define TEE_STORAGE_ROLLBACK_GUARD_H_

#include <array>
#include <cstdint>
#include <filesystem>
#include <optional>

#include "tee/runtime/durable_file.h"
#include "tee/storage/sealing.h"

namespace hosted_tee {

/// A state of the database: how often it was written, and a digest of everything in it.
struct database_state {
  std::uint64_t counter = 0;
  std::array<std::uint8_t, 32> digest{};

  friend bool operator==(const database_state&, const database_state&) = default;
};

/// A write goes: announce the next state in the file, commit the database, settle. The file thus names the database's
/// state exactly; only while a write is announced are there two, the one before and the one after it, because a crash
/// can leave either. Every other state is an older database put back, or a tampered one.
class rollback_guard {
 public:
  rollback_guard(std::filesystem::path file, const storage_key& key, step_observer step);

  /// start writes the first record of a device that is being made; `empty` is the state of an empty database. Throws
  /// call_failure.
  void start(const database_state& empty);

  /// accept tells whether `state` is the latest, and settles on it. False: rolled back or tampered with; also when the
  /// file is missing, since every device begins with one. Throws call_failure, with TEE_ERROR_SECURITY when the file
  /// does not authenticate.
  [[nodiscard]] bool accept(const database_state& state);

  /// is_settled_at tells whether `state` is the one that was accepted or settled last.
  [[nodiscard]] bool is_settled_at(const database_state& state) const { return settled_ == state; }

  void announce(const database_state& next);  ///< throws call_failure: do not commit
  void settle(const database_state& reached) noexcept;

 private:
  struct record {
    database_state settled;
    std::optional<database_state> announced;
  };
  [[nodiscard]] std::optional<record> read() const;
  void write(const record& content) const;

  std::filesystem::path file_;
  sealer sealer_;
  step_observer step_;
  database_state settled_;
};

}  // namespace hosted_tee

#endif  // TEE_STORAGE_ROLLBACK_GUARD_H_
