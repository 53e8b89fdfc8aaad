// What the normal world asks of the provisioning TA ("quil"): how a factory puts the attestation key and the device's
// properties in, once, and locks them. What the Keymaster TA asks of it is in quil_protocol.h, with its UUID.
//
// Commands that change something are taken from the normal world alone, and only until the device is locked; the
// commands of quil_protocol.h are answered to the Keymaster TA alone. Everybody else, and whatever would change
// something after the lock, gets TEE_ERROR_ACCESS_DENIED.
#ifndef TEE_COMPANIONS_PROVISIONING_PROVISIONING_PROTOCOL_H_
#define TEE_COMPANIONS_PROVISIONING_PROVISIONING_PROTOCOL_H_

#include <cstdint>

#include "src/quil/quil_protocol.h"

namespace keymaster::provisioning {

/// Each command with its slots; slots that are not named are not used. An unknown number is TEE_ERROR_NOT_SUPPORTED, a
/// client that the command is not for TEE_ERROR_ACCESS_DENIED, a wrong type in any slot TEE_ERROR_BAD_PARAMETERS, in
/// this order. Beside the errors named below there are TEE_ERROR_OUT_OF_MEMORY and what the platform answers; after any
/// failure what is stored is as it was.
enum command_t : std::uint32_t {
  /// Slot 0, memref in: the attestation key as a TLV box with tags 17, 18, 19 and either all of 20 to 24 or none, up to
  /// QUIL_KEY_CAPACITY bytes. TEE_ERROR_BAD_FORMAT for any other bytes. A second key replaces the first.
  COMMAND_PUT_KEY = 1,
  /// Slot 0, memref in: data that nothing in this system reads, up to QUIL_KEY_CAPACITY bytes
  /// (TEE_ERROR_BAD_PARAMETERS).
  COMMAND_PUT_DATA = 4,
  /// Slot 0, value in: `a` is the size in bits, 2048 and nothing else (TEE_ERROR_NOT_SUPPORTED). Slot 1, memref out:
  /// the public half of the attestation key that is made, as a SubjectPublicKeyInfo in DER; TEE_ERROR_SHORT_BUFFER with
  /// the size needed, and no key is made.
  COMMAND_GENERATE_ATTK = 6,
  /// Slot 0, memref in: a quil_property_request, 4 bytes. Slot 1, memref in: its value, 1 to property_limit bytes.
  /// TEE_ERROR_BAD_PARAMETERS for other sizes.
  COMMAND_PUT_PROPERTY = 11,
  /// No slots. From now on nothing changes any more. A device that is locked already stays so, and that is a success.
  COMMAND_LOCK = 13,
  /// Slot 0, value out: `a` is a mask of status_t. Answered to everybody.
  COMMAND_STATUS = 14,
};

/// What is there.
enum status_t : std::uint32_t {
  STATUS_KEY = 1U << 0,
  STATUS_DATA = 1U << 1,
  STATUS_SOTER_PROPERTIES = 1U << 2,
  STATUS_CPU_ID = 1U << 3,
  STATUS_DEVICE_ID = 1U << 4,
  STATUS_LOCKED = 1U << 31,
};

/// The longest value of a property.
inline constexpr std::uint32_t property_limit = QUIL_PROPERTY_CAPACITY;
/// The size of the attestation key.
inline constexpr std::uint32_t attk_bits = 2048;

}  // namespace keymaster::provisioning

#endif  // TEE_COMPANIONS_PROVISIONING_PROVISIONING_PROTOCOL_H_
