// The state folder: who holds it, which version wrote it, and what the device is.
//
//   lock       held (flock) by the process that runs the device
//   version    the number of this layout, a decimal number
//   device     the device's identity and its storage key, drawn once
//   settings   optional, written by a person: `name = value` lines
//   private.db, rpmb.db, rpmb.counter   persistent objects
//   teed.sock, teed.sock.lock           the socket of a server that was told no other place, and its lock
#ifndef TEE_RUNTIME_STATE_FOLDER_H_
#define TEE_RUNTIME_STATE_FOLDER_H_

#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <string>

#include "tee/runtime/durable_file.h"
#include "tee/runtime/file_descriptor.h"
#include "tee/storage/sealing.h"
#include "tee_api_types.h"

namespace hosted_tee {

/// What a device keeps for good.
struct device_record {
  TEE_UUID id;
  storage_key key;
};

/// What the file `settings` may say. `rpmb = on|off`, `device-id = UUID`, and the text properties of the implementation
/// by their names. Empty lines and lines that begin with # are skipped.
struct device_settings {
  std::optional<bool> rpmb;
  std::optional<TEE_UUID> device_id;
  std::map<std::string, std::string, std::less<>> text_properties;
};

/// Holds the folder's lock while it lives. The constructor makes the folder (mode 0700) and what it lacks, and throws
/// world_error; a crash at any of its steps leaves a folder that the next one completes.
class state_folder {
 public:
  ///
  /// `prepare` is called for a new device before it is recorded: what it writes is there whenever the device is.
  state_folder(const std::filesystem::path& path, const step_observer& step,
               const std::function<void(const device_record&)>& prepare);

  [[nodiscard]] const std::filesystem::path& path() const { return path_; }
  [[nodiscard]] const device_record& device() const { return device_; }
  [[nodiscard]] const device_settings& settings() const { return settings_; }

 private:
  std::filesystem::path path_;
  file_descriptor lock_;
  device_record device_{};
  device_settings settings_;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_STATE_FOLDER_H_
