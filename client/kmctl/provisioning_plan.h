// What a device is to be given in the factory: as the command line says, completed by chance.
#ifndef KEYMASTER_CLIENT_KMCTL_PROVISIONING_PLAN_H_
#define KEYMASTER_CLIENT_KMCTL_PROVISIONING_PLAN_H_

#include <optional>
#include <string>

#include "client/kmctl/command_line.h"
#include "client/kmctl/context.h"
#include "client/kmctl/password.h"
#include "client/lib/provisioning.h"
#include "client/lib/rsa_public_key.h"

namespace kmctl {

/// The options that say what goes into the device.
class provisioning_plan {
 public:
  void add_to(command_line& command);

  /// inputs gives the files that it comes from; one of them at most may be standard input.
  [[nodiscard]] std::vector<std::string> inputs() const;

  /// complete checks the texts, reads the key file and draws what was left out: a device id of 32 bytes, and as the
  /// processor's serial number 32 hexadecimal digits. Throws usage_error, failure_error, format_error.
  void complete();

  /// carry_out puts everything into the device and gives the public half of its attestation key. Throws
  /// keymaster::client::error, format_error.
  keymaster::client::rsa_public_key carry_out(keymaster::client::provisioning& device) const;

  [[nodiscard]] bool imports_key() const { return key_.has_value(); }
  [[nodiscard]] const std::string& sensor_name() const { return sensor_name_; }
  [[nodiscard]] const std::string& sensor_version() const { return sensor_version_; }
  [[nodiscard]] const std::string& cpu_id() const { return cpu_id_; }
  [[nodiscard]] const keymaster::client::bytes& device_id() const { return device_id_; }

 private:
  std::string key_file_;
  password_option passphrase_;
  std::string sensor_name_ = "hosted fingerprint sensor";
  std::string sensor_version_ = "1";
  std::string cpu_id_;
  std::string device_id_text_;
  option cpu_id_option_;  ///< tells an empty text, which is refused, from none
  option device_id_option_;

  std::optional<keymaster::client::attestation_key> key_;
  keymaster::client::bytes device_id_;
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_PROVISIONING_PLAN_H_
