// What the normal world asks of the fingerprint TA. There is no sensor behind it: who sends the touch command is the
// finger. All else is as on a device: enrolled fingers are kept, a touch is told to the Keymaster TA, and yields an
// auth token.
#ifndef TEE_COMPANIONS_FINGERPRINT_FINGERPRINT_PROTOCOL_H_
#define TEE_COMPANIONS_FINGERPRINT_FINGERPRINT_PROTOCOL_H_

#include <cstdint>

namespace keymaster::fingerprint {

/// The UUID e8a03a08-6449-45b2-b275-9b2df5dd553b, field by field as TEE_UUID and TEEC_UUID have it. The device's
/// properties name it, as the one TA whose finger ids the Keymaster TA believes.
#define FINGERPRINT_TA_UUID                          \
  {                                                  \
    0xe8a03a08, 0x6449, 0x45b2, {                    \
      0xb2, 0x75, 0x9b, 0x2d, 0xf5, 0xdd, 0x55, 0x3b \
    }                                                \
  }

/// Each command with its slots; slots that are not named are not used. A wrong type in any slot is
/// TEE_ERROR_BAD_PARAMETERS, an unknown number TEE_ERROR_NOT_SUPPORTED. TAs are answered TEE_ERROR_ACCESS_DENIED.
enum command_t : std::uint32_t {
  /// Slot 0, value in: the user's secure id, `a` its low and `b` its high half; 0 is nobody (TEE_ERROR_BAD_PARAMETERS).
  /// Slot 1, value out: `a` is the finger id, never 0 and never used before. TEE_ERROR_OVERFLOW: finger_limit is
  /// reached.
  COMMAND_ENROL = 1,
  /// Slot 0, value in: `a` is the finger id. Slot 1, value in: the token's challenge, `a` its low and `b` its high
  /// half.
  /// Slot 2, memref out: the auth token, 69 bytes. Slot 3, value out: `a` is what the Keymaster TA answered when it was
  /// told of the finger, a TEE_Result: it refuses until it has loaded the device's properties.
  /// TEE_ERROR_ITEM_NOT_FOUND: no such finger, and nothing is told to anybody; TEE_ERROR_SHORT_BUFFER, likewise, with
  /// the size needed.
  COMMAND_TOUCH = 2,
  /// Slot 0, value in: `a` is the finger id. TEE_ERROR_ITEM_NOT_FOUND.
  COMMAND_REMOVE = 3,
  /// Slot 0, memref out: for each finger, in the order of enrolment, u32 finger id and u64 secure id of its user, both
  /// little-endian. TEE_ERROR_SHORT_BUFFER with the size needed.
  COMMAND_LIST = 4,
};

/// How many fingers can be enrolled.
inline constexpr std::uint32_t finger_limit = 32;
/// One finger in the list.
inline constexpr std::uint32_t finger_record_size = 12;

}  // namespace keymaster::fingerprint

#endif  // TEE_COMPANIONS_FINGERPRINT_FINGERPRINT_PROTOCOL_H_
