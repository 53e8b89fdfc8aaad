// The latest auth tokens that were presented, so that a key with a timeout can be used for a while after the user has
// authenticated, without the token being sent again.
#ifndef KEYMASTER_AUTH_TOKEN_CACHE_H_
#define KEYMASTER_AUTH_TOKEN_CACHE_H_

#include <cstdint>
#include <span>

#include "auth/auth_token.h"

namespace keymaster {

/// token_cache_init makes the 16 empty entries. TEE_ERROR_OUT_OF_MEMORY with a trace line.
[[nodiscard]] TEE_Result token_cache_init();
void token_cache_release();

/// token_cache_store keeps a token that check_auth_token_valid accepted. A token of the same user, authenticator and
/// type replaces an older one and never a newer one, so that a replayed token evicts nothing; otherwise the first empty
/// entry takes it, or the one with the oldest time stamp.
void token_cache_store(std::span<const uint8_t, auth_token_size> token);

/// token_cache_has_recent tells whether a token of `secure_id` (as user or authenticator) whose type shares a bit with
/// `auth_type` is younger than `timeout_seconds` by the system clock. A time stamp in the future is not young.
[[nodiscard]] bool token_cache_has_recent(uint64_t secure_id, uint32_t auth_type, uint32_t timeout_seconds);

}  // namespace keymaster

#endif  // KEYMASTER_AUTH_TOKEN_CACHE_H_
