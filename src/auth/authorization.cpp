#include "auth/authorization.h"

#include "auth/auth_token.h"
#include "auth/time_base.h"
#include "auth/token_cache.h"
#include "auth/use_log.h"
#include "platform/trace.h"

namespace keymaster {

TEE_Result authorizaiton_init() {
  time_base_init();
  if (TEE_Result r = init_auth_token_key(); r != TEE_SUCCESS) return r;
  if (TEE_Result r = use_log_init(); r != TEE_SUCCESS) {
    release_auth_token_key();
    return r;
  }
  if (TEE_Result r = token_cache_init(); r != TEE_SUCCESS) {
    use_log_release();
    release_auth_token_key();
    return r;
  }
  return TEE_SUCCESS;
}

void authorizaiton_release() {
  release_auth_token_key();
  use_log_release();
  token_cache_release();
}

int check_auth(uint64_t secure_id, uint64_t challenge, const keymaster_key_param_t* token,
               const keymaster_key_param_t* auth_timeout, const keymaster_key_param_t& user_auth_type) {
  const uint32_t auth_type = user_auth_type.enumerated;
  if (token == nullptr) {
    if (auth_timeout == nullptr) return 1;
    return token_cache_has_recent(secure_id, auth_type, auth_timeout->integer) ? 0 : 1;
  }
  const std::span<const uint8_t, auth_token_size> bytes{token->blob.data, auth_token_size};
  const auth_token_fields fields = parse_auth_token(bytes);
  token_cache_store(bytes);
  if (fields.user_id != secure_id && fields.authenticator_id != secure_id) {
    TRACE_ERROR("User id mismatch");
    return 1;
  }
  if ((fields.authenticator_type & auth_type) == 0) {
    TRACE_ERROR("Auth type mismatch");
    return 1;
  }
  if (challenge != 0 && challenge != fields.challenge) {
    TRACE_ERROR("Challenge mismatch");
    return 1;
  }
  return 0;
}

namespace {

/// Whether the key needs an auth token with each update and finish.
bool needs_token_per_operation(const keymaster_operation_t& operation) {
  const keymaster_key_param_set_t& key = operation.authorization_set;
  const keymaster_key_param_t* const algorithm = key_param_set_get_unique(key, KM_TAG_ALGORITHM);
  const bool asymmetric =
      algorithm != nullptr && (algorithm->enumerated == KM_ALGORITHM_RSA || algorithm->enumerated == KM_ALGORITHM_EC);
  const bool public_purpose = operation.purpose == KM_PURPOSE_ENCRYPT || operation.purpose == KM_PURPOSE_VERIFY;
  if (asymmetric && public_purpose) return false;
  // A timeout was settled at begin, and must not run out in the middle of an operation.
  return !key_param_set_contains(key, KM_TAG_NO_AUTH_REQUIRED) &&
         key_param_set_get_unique(key, KM_TAG_AUTH_TIMEOUT) == nullptr &&
         key_param_set_contains(key, KM_TAG_USER_SECURE_ID);
}

/// Whether `token` answers this operation for any of the key's secure ids.
bool token_answers(const keymaster_key_param_set_t& key, const keymaster_key_param_t& token, uint32_t handle) {
  const keymaster_key_param_t* const auth_type = key_param_set_get_unique(key, KM_TAG_USER_AUTH_TYPE);
  if (auth_type == nullptr) return false;
  for (const keymaster_key_param_t* id = nullptr;
       (id = key_param_set_find_next(key, KM_TAG_USER_SECURE_ID, id)) != nullptr;) {
    if (check_auth(id->long_integer, handle, &token, nullptr, *auth_type) == 0) return true;
  }
  return false;
}

}  // namespace

TEE_Result authorize_update_or_finish(const keymaster_key_param_set_t& in_params,
                                      const keymaster_operation_t& operation, uint32_t handle,
                                      keymaster_error_t* error) {
  *error = KM_ERROR_OK;
  if (!needs_token_per_operation(operation)) return TEE_SUCCESS;

  const keymaster_key_param_t* const token = key_param_set_get_unique(in_params, KM_TAG_AUTH_TOKEN);
  if (token != nullptr && check_auth_token_valid(token->blob.data, token->blob.data_length) != 0) {
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  if (token == nullptr || !token_answers(operation.authorization_set, *token, handle)) {
    TRACE_ERROR("Auth token check failed");
    *error = KM_ERROR_KEY_USER_NOT_AUTHENTICATED;
  }
  return TEE_SUCCESS;
}

}  // namespace keymaster
