// What the normal world asks of the password authenticator: enrol a user's password, and turn the password into an auth
// token. The TA keeps no password: the normal world keeps a handle per user, which is worth nothing without the TA's
// own key.
#ifndef TEE_COMPANIONS_AUTHENTICATOR_AUTHENTICATOR_PROTOCOL_H_
#define TEE_COMPANIONS_AUTHENTICATOR_AUTHENTICATOR_PROTOCOL_H_

#include <cstdint>

namespace keymaster::authenticator {

/// The UUID c45dc7dc-4431-4648-ba1e-28d7b155718e, field by field as TEE_UUID and TEEC_UUID have it.
#define AUTHENTICATOR_TA_UUID                        \
  {                                                  \
    0xc45dc7dc, 0x4431, 0x4648, {                    \
      0xba, 0x1e, 0x28, 0xd7, 0xb1, 0x55, 0x71, 0x8e \
    }                                                \
  }

/// Each command with its slots; slots that are not named are not used. Numbers in bodies are little-endian; `bytes` is
/// u32 length and that many bytes. A wrong type in any slot, and a body that ends early or has more than it should, is
/// TEE_ERROR_BAD_PARAMETERS; an unknown number TEE_ERROR_NOT_SUPPORTED. TAs are answered TEE_ERROR_ACCESS_DENIED.
///
/// A wrong password, or a handle that this TA did not make for this user, is TEE_ERROR_ACCESS_DENIED and counts as a
/// failure of that user. After free_failures of them in a row every attempt, also one with the right password, is
/// TEE_ERROR_BUSY until the time that slot 0 or 3 tells has passed; the time doubles with each further failure, up to a
/// day. The count outlives restarts, and a right password clears it. An enrolment anew, which shows no password, is
/// neither an attempt nor a way to clear the count.
enum command_t : std::uint32_t {
  /// Slot 0, value in: `a` is the uid. Slot 1, memref in: bytes the present handle, bytes the present password, bytes
  /// the new password. Both empty: a new secure id is drawn; else they must be right, and the user keeps the secure id.
  /// Slot 2, memref out: the new handle, handle_size bytes (TEE_ERROR_SHORT_BUFFER with that size, before anything else
  /// happens). Slot 3, value out: the secure id, `a` its low and `b` its high half; with TEE_ERROR_BUSY `a` is how many
  /// milliseconds to wait. An empty new password, or one above password_limit bytes: TEE_ERROR_BAD_PARAMETERS.
  COMMAND_ENROL = 1,
  /// Slot 0, value in and out: `a` is the uid; on return 0, with TEE_ERROR_BUSY how many milliseconds to wait. Slot 1,
  /// memref in: u64 challenge, bytes the handle, bytes the password. Slot 2, memref out: the auth token, 69 bytes
  /// (TEE_ERROR_SHORT_BUFFER with that size, before anything else happens).
  COMMAND_VERIFY = 2,
};

/// u8 version 0, u32 uid, u64 secure id, 16 bytes salt, 32 bytes HMAC-SHA256 over all of that and the password.
inline constexpr std::uint32_t handle_size = 61;
inline constexpr std::uint32_t password_limit = 1024;

/// How many failures in a row bring the first wait, how long it is, and how long the longest. The time is counted by
/// the system clock, which begins anew at a boot; a boot never shortens a wait.
inline constexpr std::uint32_t free_failures = 5;
inline constexpr std::uint64_t first_wait_ms = 30000;
inline constexpr std::uint64_t longest_wait_ms = std::uint64_t{24} * 60 * 60 * 1000;

}  // namespace keymaster::authenticator

#endif  // TEE_COMPANIONS_AUTHENTICATOR_AUTHENTICATOR_PROTOCOL_H_
