// The hosted secure world: TA instances, their sessions, and the device around them.
//
// One secure_world is one device: a state folder, a device identity, clocks, storage, and the TA instances that run on
// it. It is a development and test runtime and not a security boundary: it lives in the process that opens it.
#ifndef TEE_RUNTIME_SECURE_WORLD_H_
#define TEE_RUNTIME_SECURE_WORLD_H_

#include <array>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <stdexcept>
#include <string>
#include <vector>

#include "tee/runtime/accounting.h"
#include "tee/runtime/builtin_ta.h"
#include "tee/runtime/clocks.h"
#include "tee/runtime/device.h"
#include "tee/runtime/faults.h"
#include "tee/runtime/trace_log.h"
#include "tee_internal_api_extensions.h"

namespace hosted_tee {

/// Why a state folder cannot be used.
enum class world_fault {
  busy,       ///< another process holds the folder
  foreign,    ///< it holds something else
  newer,      ///< a newer version of the hosted TEE wrote it
  malformed,  ///< one of its text files can't be parsed: a mistake in `settings`, or another one altered
  corrupt,    ///< its content does not authenticate, or belongs to another device
  io,         ///< the system refused (permissions, space, …)
};

class world_error : public std::runtime_error {
 public:
  world_error(world_fault fault, const std::string& what) : std::runtime_error(what), fault_(fault) {}
  [[nodiscard]] world_fault fault() const { return fault_; }

 private:
  world_fault fault_;
};

/// What a device is made of. Everything has a default; tests set what they need.
struct world_options {
  std::filesystem::path state;        ///< state folder; made when missing (mode 0700)
  std::filesystem::path ta_folder;    ///< where `<uuid>.ta` images lie; empty: see default_ta_folders
  std::optional<bool> rpmb;           ///< whether the device has RPMB storage; default: its settings, else yes
  std::optional<TEE_UUID> device_id;  ///< default: its settings, else drawn once and kept in the state folder
  std::optional<std::array<std::uint8_t, 32>> boot_seed;  ///< default: drawn at every start
  std::optional<std::uint32_t> heap_limit;                ///< of every TA, instead of its gpd.ta.dataSize

  /// Lines up to this level stay in the trace. The Client API keeps errors alone: formatting lines for each command
  /// that nobody reads costs as much as a small command itself.
  trace_level kept_trace = trace_level::debug;

  /// As fault_plan::at_storage_step, from the very first step on; empty: none.
  std::function<void(std::string_view step)> at_storage_step;
};

/// One live instance of a TA.
struct instance_status {
  TEE_UUID ta;
  std::uint32_t sessions = 0;
  std::uint32_t heap_limit = 0;
  accounting held;
};

/// A device at one moment, between two commands.
struct world_status {
  std::uint32_t sessions = 0;     ///< of clients, and of TAs with each other; those of dead instances too
  std::uint64_t commands = 0;     ///< since the device started
  std::uint64_t trace_total = 0;  ///< lines that the trace has held since then
  std::uint32_t trace_kept = 0;   ///< lines that it holds
  std::vector<instance_status> instances;
};

/// A line of the trace with its number: the device's first line has number 0.
struct numbered_line {
  std::uint64_t number;
  trace_line line;
};

/// One device. Calls are serialised: one command at a time in the secure world, whichever thread asks; a TA that calls
/// another TA nests. Not copyable; held by shared_ptr because Client API contexts share it. When the last pointer goes,
/// the device is switched off: its instances end without running any more code.
class secure_world {
 public:
  /// open starts the device in `options.state`. Throws world_error; busy also when this process has it open.
  static std::shared_ptr<secure_world> open(const world_options& options);

  /// find_open answers the running device of a folder in this process, or null. open_shared opens it when there is
  /// none; the Client API's embedded contexts go through it, so a test that holds the pointer controls the very device
  /// that its client talks to.
  static std::shared_ptr<secure_world> find_open(const std::filesystem::path& state);
  static std::shared_ptr<secure_world> open_shared(const world_options& options);

  secure_world(const secure_world&) = delete;
  secure_world& operator=(const secure_world&) = delete;
  virtual ~secure_world() = default;

  /// open_session opens a session of `client` to the TA `ta`, creating its instance when the TA's flags ask for it.
  /// `session` receives a nonzero identifier. Errors: TEE_ERROR_ITEM_NOT_FOUND (no such TA), TEE_ERROR_BAD_FORMAT (what
  /// lies there is not an image of that TA; the trace tells why), TEE_ERROR_BUSY (the TA takes one session at a time,
  /// or calls itself), TEE_ERROR_TARGET_DEAD (it panicked on the way), TEE_ERROR_BAD_PARAMETERS (parameter types), what
  /// TA_CreateEntryPoint or TA_OpenSessionEntryPoint return; `origin` is one of TEE_ORIGIN_*. After a panic the next
  /// session starts a fresh instance; the sessions of the dead one stay dead.
  virtual TEE_Result open_session(const TEE_UUID& ta, const TEE_Identity& client, std::uint32_t param_types,
                                  TEE_Param params[4], std::uint32_t& session, std::uint32_t& origin) = 0;

  /// invoke carries out one command. After a panic of the instance: TEE_ERROR_TARGET_DEAD, origin TEE_ORIGIN_TEE.
  virtual TEE_Result invoke(std::uint32_t session, std::uint32_t command, std::uint32_t param_types,
                            TEE_Param params[4], std::uint32_t& origin) = 0;

  /// close_session closes a session; with the last one an instance that isn't kept alive is destroyed. Unknown
  /// identifiers are ignored.
  virtual void close_session(std::uint32_t session) = 0;

  /// The device's parts, for tests. A test touches them between calls, never during one of another thread.
  [[nodiscard]] virtual device_services& device() = 0;
  [[nodiscard]] virtual bool has_rpmb() const = 0;  ///< whether there is RPMB storage and it passed its check
  [[nodiscard]] virtual clocks& clock() = 0;
  [[nodiscard]] virtual fault_plan& faults() = 0;
  [[nodiscard]] virtual trace_log& trace() = 0;
  [[nodiscard]] virtual TEE_UUID device_id() const = 0;
  [[nodiscard]] virtual std::array<std::uint8_t, 32> boot_seed() const = 0;  ///< what the authenticators share

  /// account tells what the TA's live instance holds; all zero when it has none.
  [[nodiscard]] virtual accounting account(const TEE_UUID& ta) const = 0;

  /// status and trace_lines wait for the running command, like every command does, and may be called whenever one may.
  /// trace_lines gives up to `limit` lines, from number `from` on or from the oldest that is held.
  [[nodiscard]] virtual world_status status() const = 0;
  [[nodiscard]] virtual std::vector<numbered_line> trace_lines(std::uint64_t from, std::size_t limit) const = 0;

  /// has_instance tells whether the TA has a live instance (one that did not panic).
  [[nodiscard]] virtual bool has_instance(const TEE_UUID& ta) const = 0;

  /// set_free_inspector installs a function that sees every heap block of any TA right before it is freed (and the old
  /// block of a reallocation that moves), so that a test can look for secrets that were not wiped. Empty: none.
  virtual void set_free_inspector(std::function<void(std::span<const std::uint8_t>)> inspector) = 0;

  /// Persistent objects as raw data streams, for tests that prepare or examine storage. read_object answers nothing
  /// when the object is absent; write_object creates or replaces it. Thrown: call_failure (a std::exception) when the
  /// storage refuses, std::invalid_argument when the device has no such storage.
  [[nodiscard]] virtual std::optional<std::string> read_object(const TEE_UUID& ta, std::uint32_t storage,
                                                               std::string_view id) = 0;
  virtual void write_object(const TEE_UUID& ta, std::uint32_t storage, std::string_view id, std::string_view data) = 0;
  virtual void delete_object(const TEE_UUID& ta, std::uint32_t storage, std::string_view id) = 0;

 protected:
  secure_world() = default;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_SECURE_WORLD_H_
