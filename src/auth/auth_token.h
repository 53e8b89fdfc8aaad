// Auth tokens: what an authenticator (password, fingerprint) issues when a user has proved who they are. The TA trusts
// a token if its MAC verifies under the secret of this boot, which it shares with the authenticators.
#ifndef KEYMASTER_AUTH_AUTH_TOKEN_H_
#define KEYMASTER_AUTH_AUTH_TOKEN_H_

#include <cstdint>
#include <span>

#include "tee_internal_api.h"

namespace keymaster {

inline constexpr uint32_t auth_token_size = 69;
inline constexpr uint8_t auth_token_version = 0;

/// A token's fields, in native order:
///   offset 0 version, 1 challenge, 9 user id, 17 authenticator id (as issued, little-endian),
///   25 authenticator type, 29 time stamp (big-endian), 37 HMAC-SHA256 over bytes 0 to 36.
struct auth_token_fields {
  uint64_t challenge;           // the operation the token answers, or 0
  uint64_t user_id;             // secure user id
  uint64_t authenticator_id;    // the authenticator's own id of the user
  uint32_t authenticator_type;  // bit mask
  uint64_t timestamp;           // milliseconds since boot
};

/// parse_auth_token reads the fields; the version and the MAC are check_auth_token_valid's business.
[[nodiscard]] auth_token_fields parse_auth_token(std::span<const uint8_t, auth_token_size> token);

/// init_auth_token_key makes the key object from the platform's boot seed, which is kept nowhere else. The result is
/// the platform's.
[[nodiscard]] TEE_Result init_auth_token_key();
void release_auth_token_key();

/// ComputeSignature writes the first bytes of HMAC-SHA256(`message`) under `key` to `signature`, and tells whether that
/// is the whole MAC. On a failure `signature` is all zero; without the answer a token whose MAC is zero bytes would
/// pass whenever the platform runs out of operations.
[[nodiscard]] bool ComputeSignature(uint8_t* signature, uint32_t signature_length, TEE_ObjectHandle key,
                                    const uint8_t* message, uint32_t message_length);

/// check_auth_token_valid answers 0 for a token of the right size and version whose MAC verifies, else 1.
[[nodiscard]] int check_auth_token_valid(const uint8_t* token, uint32_t token_length);

}  // namespace keymaster

#endif  // KEYMASTER_AUTH_AUTH_TOKEN_H_
