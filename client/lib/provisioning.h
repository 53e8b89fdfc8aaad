// How a factory gives a device its identity: the attestation key and the properties, once, and then the lock.
#ifndef KEYMASTER_CLIENT_LIB_PROVISIONING_H_
#define KEYMASTER_CLIENT_LIB_PROVISIONING_H_

#include <cstdint>
#include <optional>
#include <string_view>

#include "client/lib/bytes.h"
#include "client/lib/ta_session.h"
#include "tee/companions/provisioning/provisioning_protocol.h"

namespace keymaster::client {

/// What is there.
struct provisioning_status {
  bool key = false;               ///< the attestation key
  bool data = false;              ///< the factory's own data
  bool soter_properties = false;  ///< the fingerprint sensor's name, version and TA
  bool cpu_id = false;
  bool device_id = false;
  bool locked = false;  ///< nothing changes any more

  friend bool operator==(const provisioning_status&, const provisioning_status&) = default;
};

/// An attestation key that was made outside the device.
struct attestation_key {
  secret_bytes box;  ///< as the provisioning TA takes it
  bytes public_key;  ///< SubjectPublicKeyInfo in DER
};

/// read_attestation_key converts a private key file as read_private_key does. Throws format_error for everything that
/// it refuses, and for a key that is not a 2048-bit RSA key.
[[nodiscard]] attestation_key read_attestation_key(byte_view file, std::optional<std::string_view> passphrase = {});

/// A session with the provisioning TA. Every call throws error with error_kind::companion when the TA refuses it:
/// TEEC_ERROR_ACCESS_DENIED says that the device is locked.
class provisioning {
 public:
  /// Opens the session. Throws error with error_kind::connection.
  explicit provisioning(connection& tee);

  [[nodiscard]] provisioning_status status();

  /// generate_attk has the attestation key made inside the TA, in place of one that is there, and gives its public half
  /// as a SubjectPublicKeyInfo in DER. Throws format_error when the answer is none.
  bytes generate_attk();

  /// put_key hands the attestation key over, in place of one that is there.
  void put_key(const attestation_key& key);

  /// put_property stores a property. Its value has 1 to provisioning::property_limit bytes.
  void put_property(const quil_property_request& property, byte_view value);

  /// put_soter_properties stores what the Keymaster TA must know of the fingerprint sensor: name, version, and the TA
  /// whose finger ids it believes. Throws std::invalid_argument when a text has a zero in it, or when they are too long
  /// together.
  void put_soter_properties(std::string_view sensor_name, std::string_view sensor_version, const TEEC_UUID& ta);

  /// put_cpu_id stores the processor's serial number: 1 to 63 printable ASCII characters. put_device_id stores 16 to 32
  /// bytes. Throw std::invalid_argument for others.
  void put_cpu_id(std::string_view id);
  void put_device_id(byte_view id);

  /// lock ends the provisioning, for ever.
  void lock();

 private:
  ta_session session_;
};

/// The bounds of what the device is identified by.
inline constexpr std::size_t shortest_device_id = 16;
inline constexpr std::size_t longest_device_id = 32;
inline constexpr std::size_t longest_cpu_id = QUIL_CPU_ID_CAPACITY - 1;

/// The fingerprint TA of this system.
extern const TEEC_UUID fingerprint_ta;

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_PROVISIONING_H_
