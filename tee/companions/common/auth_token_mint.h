// Auth tokens, as both authenticators mint them and the Keymaster TA checks them: nothing but the boot's secret makes
// one.
#ifndef TEE_COMPANIONS_COMMON_AUTH_TOKEN_MINT_H_
#define TEE_COMPANIONS_COMMON_AUTH_TOKEN_MINT_H_

#include <cstdint>
#include <span>

#include "tee_internal_api.h"

namespace keymaster::companion {

/// A token:
///   offset 0 version 0, 1 challenge, 9 secure id, 17 authenticator id (little-endian),
///   25 authenticator type, 29 time in milliseconds (big-endian), 37 HMAC-SHA256 over bytes 0 to 36.
inline constexpr uint32_t auth_token_size = 69;

/// How the user proved who they are: a bit each, since a key can ask for any of several.
enum authenticator_type_t : uint32_t {
  AUTHENTICATOR_PASSWORD = 1U << 0,
  AUTHENTICATOR_FINGERPRINT = 1U << 1,
};

/// What a token says.
struct auth_token_claim {
  uint64_t challenge = 0;         ///< the operation that it answers, or 0
  uint64_t secure_id = 0;         ///< the user
  uint64_t authenticator_id = 0;  ///< the authenticator's own, drawn once
  authenticator_type_t authenticator_type = AUTHENTICATOR_PASSWORD;
  uint64_t time_ms = 0;  ///< when, by the system clock
};

/// system_time_ms reads the clock that tokens and notifications are stamped with.
[[nodiscard]] uint64_t system_time_ms();

/// mint_auth_token writes the token of `claim`. The result is the platform's; the token is all zero unless it is
/// TEE_SUCCESS.
[[nodiscard]] TEE_Result mint_auth_token(const auth_token_claim& claim, std::span<uint8_t, auth_token_size> token);

}  // namespace keymaster::companion

#endif  // TEE_COMPANIONS_COMMON_AUTH_TOKEN_MINT_H_
