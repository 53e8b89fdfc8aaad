#include "client/kmctl/provisioning_plan.h"

#include <fmt/format.h>
#include <openssl/rand.h>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/values.h"
#include "client/lib/key_material.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

constexpr std::size_t longest_sensor_text = 63;
constexpr std::size_t serial_number_size = 16;

bytes draw(std::size_t count) {
  bytes random(count);
  if (RAND_bytes(random.data(), static_cast<int>(count)) != 1) {
    throw failure_error("the system gives no random numbers");
  }
  return random;
}

/// Statements carry these texts, and a person compares them.
void check_text(const char* option, const std::string& text, std::size_t longest) {
  if (text.empty() || text.size() > longest || !is_printable_ascii(text)) {
    throw usage_error(fmt::format("{} takes 1 to {} printable ASCII characters", option, longest));
  }
}

bytes read_device_id(const std::string& text) {
  bytes id = parse_bytes(text);
  if (id.size() < client::shortest_device_id || id.size() > client::longest_device_id) {
    throw usage_error(fmt::format("a device id has {} to {} bytes, not {}", client::shortest_device_id,
                                  client::longest_device_id, id.size()),
                      "write hex:… for its bytes, @FILE for a file's content, or a text of that length");
  }
  return id;
}

client::attestation_key read_key(const std::string& path, const password_option& passphrase) {
  const secret_bytes file = read_secret_file(path, "private key");
  if (passphrase.file().empty()) {
    return client::read_attestation_key(file);
  }
  const secret_bytes text = read_password_file(passphrase.file());
  return client::read_attestation_key(file, client::as_text(text));
}

}  // namespace

void provisioning_plan::add_to(command_line& command) {
  const option key =
      command.add_option("--key", key_file_,
                         "private key file to use as the attestation key, RSA-2048, - for standard input "
                         "(default: one is made inside, and never leaves)");
  key.type_name("FILE");
  passphrase_.add_to(command, "--passphrase-file", "file with the passphrase of an encrypted key").needs(key);
  command.add_option("--sensor-name", sensor_name_, "the fingerprint sensor's name")
      .type_name("TEXT")
      .capture_default();
  command.add_option("--sensor-version", sensor_version_, "its version").type_name("TEXT").capture_default();
  cpu_id_option_ =
      command.add_option("--cpu-id", cpu_id_, "the processor's serial number, 1 to 63 characters (default: drawn)");
  cpu_id_option_.type_name("TEXT");
  device_id_option_ = command.add_option("--device-id", device_id_text_,
                                         "the device's id, 16 to 32 bytes: hex:…, @FILE or text (default: drawn)");
  device_id_option_.type_name("VALUE");
}

std::vector<std::string> provisioning_plan::inputs() const {
  std::vector<std::string> files{key_file_, passphrase_.file()};
  if (const auto file = file_of_value(device_id_text_)) {
    files.push_back(*file);
  }
  return files;
}

void provisioning_plan::complete() {
  if (!cpu_id_option_.is_given()) {
    cpu_id_ = to_hex(draw(serial_number_size));
  }
  check_text("--cpu-id", cpu_id_, client::longest_cpu_id);
  check_text("--sensor-name", sensor_name_, longest_sensor_text);
  check_text("--sensor-version", sensor_version_, longest_sensor_text);
  device_id_ = device_id_option_.is_given() ? read_device_id(device_id_text_) : draw(client::longest_device_id);
  refuse_shared_input({&key_file_, &passphrase_.file()});
  if (!key_file_.empty()) {
    key_ = read_key(key_file_, passphrase_);
  }
}

client::rsa_public_key provisioning_plan::carry_out(client::provisioning& device) const {
  bytes der;
  if (key_) {
    device.put_key(*key_);
    der = key_->public_key;
  } else {
    der = device.generate_attk();
  }
  device.put_soter_properties(sensor_name_, sensor_version_, client::fingerprint_ta);
  device.put_cpu_id(cpu_id_);
  device.put_device_id(device_id_);
  return client::rsa_public_key::from_pem(client::public_key_pem(keymaster::KM_ALGORITHM_RSA, der));
}

}  // namespace kmctl
