// Whether a key's characteristics allow what a client asks for.
//
// A refusal is a Keymaster error and never a TEE result. Public-key operations (RSA and EC, encrypt and verify) are
// never restricted: anybody can carry them out with the exported key.
#ifndef KEYMASTER_AUTH_AUTHORIZATION_H_
#define KEYMASTER_AUTH_AUTHORIZATION_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "params/operation.h"
#include "tee_internal_api.h"

namespace keymaster {

/// Not an error: begin may go on, and each update and finish needs an auth token bound to the operation.
inline constexpr keymaster_error_t KM_OP_AUTH_NEEDED = static_cast<keymaster_error_t>(15);

/// authorizaiton_init reads the clocks, makes the key that auth tokens are checked with, and the two tables. On failure
/// nothing is left behind; the result is the platform's, or TEE_ERROR_OUT_OF_MEMORY. (The name's spelling is that of
/// the interface.)
[[nodiscard]] TEE_Result authorizaiton_init();

/// authorizaiton_release frees what authorizaiton_init made.
void authorizaiton_release();

/// authorize_begin decides on an operation of `purpose` with the key of `blob`, whose `characteristics` were inside,
/// and records the use where the key limits uses. `*error`: KM_ERROR_OK, KM_OP_AUTH_NEEDED or a refusal. The result is
/// always TEE_SUCCESS.
[[nodiscard]] TEE_Result authorize_begin(std::span<const uint8_t> blob, uint32_t purpose,
                                         const keymaster_key_param_set_t& in_params,
                                         const keymaster_key_param_set_t& characteristics, keymaster_error_t* error);

/// authorize_update_or_finish checks the auth token of a key that needs one per operation; its challenge must be
/// `handle`. Dates, limits and modes were settled at begin. The result is always TEE_SUCCESS.
[[nodiscard]] TEE_Result authorize_update_or_finish(const keymaster_key_param_set_t& in_params,
                                                    const keymaster_operation_t& operation, uint32_t handle,
                                                    keymaster_error_t* error);

/// check_auth answers 0 when `secure_id` is authenticated, else 1. With a `token` (one that check_auth_token_valid
/// accepted) the token decides, and is kept for later; a nonzero `challenge` must be the token's. Without one, a recent
/// token may, if the key has an `auth_timeout`.
[[nodiscard]] int check_auth(uint64_t secure_id, uint64_t challenge, const keymaster_key_param_t* token,
                             const keymaster_key_param_t* auth_timeout, const keymaster_key_param_t& user_auth_type);

}  // namespace keymaster

#endif  // KEYMASTER_AUTH_AUTHORIZATION_H_
