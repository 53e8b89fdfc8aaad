#include <array>

#include "auth/auth_token.h"
#include "auth/authorization.h"
#include "auth/time_base.h"
#include "auth/use_log.h"
#include "platform/trace.h"
#include "ta/algorithm_registry.h"

namespace keymaster {
namespace {

/// One thing that the request asks for and the key must list: a purpose, a padding, a block mode, a digest.
struct requirement {
  uint32_t value = 0;
  bool met = false;

  void offer(uint32_t listed) { met = met || listed == value; }
};

enum class user_auth { not_required, required, satisfied };

/// A request to begin, on its walk through the key's characteristics.
struct begin_request {
  std::span<const uint8_t> blob;
  uint32_t algorithm;
  const keymaster_key_param_set_t& in_params;
  const keymaster_key_param_set_t& key;
  const keymaster_key_param_t* token = nullptr;  // verified
  const keymaster_key_param_t* auth_timeout = nullptr;
  const keymaster_key_param_t* user_auth_type = nullptr;
  bool no_auth_required = false;
  requirement purpose = {}, padding = {}, block_mode = {}, digest = {};
  user_auth authentication = user_auth::not_required;
};

/// A rule looks at one parameter of the key and answers KM_ERROR_OK or its refusal.
using begin_rule = keymaster_error_t (*)(begin_request& request, const keymaster_key_param_t& param);

/// What the key lists may be what the request asks for.
template <requirement begin_request::*Asked>
keymaster_error_t offer(begin_request& request, const keymaster_key_param_t& param) {
  (request.*Asked).offer(param.enumerated);
  return KM_ERROR_OK;
}

keymaster_error_t check_min_mac_length(begin_request& request, const keymaster_key_param_t& param) {
  const bool makes_macs = request.algorithm == KM_ALGORITHM_HMAC ||
                          (request.algorithm == KM_ALGORITHM_AES && request.block_mode.value == KM_MODE_GCM);
  if (!makes_macs) return KM_ERROR_OK;
  const keymaster_key_param_t* const asked = key_param_set_get_unique(request.in_params, KM_TAG_MAC_LENGTH);
  return asked != nullptr && asked->integer < param.integer ? KM_ERROR_INVALID_MAC_LENGTH : KM_ERROR_OK;
}

keymaster_error_t check_secure_id(begin_request& request, const keymaster_key_param_t& param) {
  if (request.no_auth_required) {
    TRACE_ERROR("Found KM_TAG_USER_SECURE_ID but also KM_TAG_NO_AUTH_REQUIRED");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  if (request.user_auth_type == nullptr) {
    TRACE_ERROR("Found KM_TAG_USER_SECURE_ID but no KM_TAG_USER_AUTH_TYPE");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  if (request.authentication == user_auth::not_required) request.authentication = user_auth::required;
  if (check_auth(param.long_integer, 0, request.token, request.auth_timeout, *request.user_auth_type) == 0) {
    request.authentication = user_auth::satisfied;
  }
  return KM_ERROR_OK;
}

keymaster_error_t check_active(begin_request&, const keymaster_key_param_t& param) {
  if (time_base_now_ms() >= param.date_time) return KM_ERROR_OK;
  TRACE_ERROR("Key not yet valid");
  return KM_ERROR_KEY_NOT_YET_VALID;
}

/// Compares the wall clock with a use that was recorded by the system clock. The two mix on purpose: where the wall
/// clock is far ahead, the limit never refuses.
keymaster_error_t check_rate(begin_request& request, const keymaster_key_param_t& param) {
  uint32_t last_use = 0;
  if (!use_log_last_use(request.blob, &last_use)) return KM_ERROR_OK;
  if (time_base_now().seconds - last_use > param.integer) return KM_ERROR_OK;
  TRACE_ERROR("key rate limit exceeded");
  return KM_ERROR_KEY_RATE_LIMIT_EXCEEDED;
}

keymaster_error_t check_max_uses(begin_request& request, const keymaster_key_param_t& param) {
  keymaster_error_t error = KM_ERROR_OK;
  return check_use_count_and_add(request.blob, param.integer, &error) == 0 ? KM_ERROR_OK : error;
}

keymaster_error_t check_expiry(const keymaster_key_param_t& param) {
  if (time_base_now_ms() <= param.date_time) return KM_ERROR_OK;
  TRACE_ERROR("Key expired");
  return KM_ERROR_KEY_EXPIRED;
}

/// What was protected in the past stays readable longer than new things may be protected.
keymaster_error_t check_usage_expiry(begin_request& request, const keymaster_key_param_t& param) {
  const bool uses = request.purpose.value == KM_PURPOSE_DECRYPT || request.purpose.value == KM_PURPOSE_VERIFY;
  return uses ? check_expiry(param) : KM_ERROR_OK;
}
keymaster_error_t check_origination_expiry(begin_request& request, const keymaster_key_param_t& param) {
  const bool originates = request.purpose.value == KM_PURPOSE_ENCRYPT || request.purpose.value == KM_PURPOSE_SIGN;
  return originates ? check_expiry(param) : KM_ERROR_OK;
}

keymaster_error_t refuse_bootloader_only(begin_request&, const keymaster_key_param_t&) {
  TRACE_ERROR("Bootloader only key");
  return KM_ERROR_INVALID_KEY_BLOB;
}

struct tag_rule {
  keymaster_tag_t tag;
  begin_rule rule;
};

/// Tags that aren't here say nothing about begin.
constexpr std::array<tag_rule, 12> begin_rules = {{
    {KM_TAG_MIN_MAC_LENGTH, check_min_mac_length},
    {KM_TAG_PADDING, offer<&begin_request::padding>},
    {KM_TAG_BLOCK_MODE, offer<&begin_request::block_mode>},
    {KM_TAG_DIGEST, offer<&begin_request::digest>},
    {KM_TAG_PURPOSE, offer<&begin_request::purpose>},
    {KM_TAG_USER_SECURE_ID, check_secure_id},
    {KM_TAG_ACTIVE_DATETIME, check_active},
    {KM_TAG_MIN_SECONDS_BETWEEN_OPS, check_rate},
    {KM_TAG_MAX_USES_PER_BOOT, check_max_uses},
    {KM_TAG_USAGE_EXPIRE_DATETIME, check_usage_expiry},
    {KM_TAG_ORIGINATION_EXPIRE_DATETIME, check_origination_expiry},
    {KM_TAG_BOOTLOADER_ONLY, refuse_bootloader_only},
}};

/// Applies the rules in the order of the key's parameters; the first refusal ends the walk.
keymaster_error_t walk_characteristics(begin_request& request) {
  for (const keymaster_key_param_t& param : records(request.key)) {
    for (const tag_rule& entry : begin_rules) {
      if (entry.tag != param.tag) continue;
      if (const keymaster_error_t error = entry.rule(request, param); error != KM_ERROR_OK) return error;
    }
  }
  return KM_ERROR_OK;
}

/// Reads what the request asks for, as the algorithm understands it. What doesn't apply is met from the start.
keymaster_error_t read_requirements(begin_request& request) {
  if (find_algorithm(request.algorithm) == nullptr) return KM_ERROR_UNSUPPORTED_ALGORITHM;
  const keymaster_purpose_ops* const ops = find_purpose_ops(request.algorithm, request.purpose.value);
  if (ops == nullptr || ops->get_padding == nullptr || ops->get_block_mode == nullptr || ops->get_digest == nullptr) {
    return KM_ERROR_UNSUPPORTED_PURPOSE;
  }
  request.padding.met = ops->get_padding(request.in_params, &request.padding.value) == parameter_not_applicable;
  request.block_mode.met =
      ops->get_block_mode(request.in_params, &request.block_mode.value) == parameter_not_applicable;
  request.digest.met = ops->get_digest(request.in_params, &request.digest.value) == parameter_not_applicable;
  return KM_ERROR_OK;
}

keymaster_error_t check_requirements(const begin_request& request) {
  if (!request.purpose.met) {
    TRACE_ERROR("No such purpose in key_params");
    return KM_ERROR_INCOMPATIBLE_PURPOSE;
  }
  if (!request.padding.met) {
    TRACE_ERROR("No such padding in key_params");
    return KM_ERROR_INCOMPATIBLE_PADDING_MODE;
  }
  if (!request.block_mode.met) {
    TRACE_ERROR("No such block mode in key_params");
    return KM_ERROR_INCOMPATIBLE_BLOCK_MODE;
  }
  if (!request.digest.met) {
    TRACE_ERROR("No such digest in key_params");
    return KM_ERROR_INCOMPATIBLE_DIGEST;
  }
  if (request.authentication != user_auth::required) return KM_ERROR_OK;
  if (request.auth_timeout == nullptr) {
    TRACE_ERROR("OP AUTH NEEDED");
    return KM_OP_AUTH_NEEDED;
  }
  TRACE_ERROR("Auth token check failed");
  return KM_ERROR_KEY_USER_NOT_AUTHENTICATED;
}

keymaster_error_t check_caller_nonce(const begin_request& request) {
  if (request.purpose.value != KM_PURPOSE_ENCRYPT || !key_param_set_contains(request.in_params, KM_TAG_NONCE) ||
      key_param_set_contains(request.key, KM_TAG_CALLER_NONCE)) {
    return KM_ERROR_OK;
  }
  TRACE_ERROR("Caller nonce prohibited");
  return KM_ERROR_CALLER_NONCE_PROHIBITED;
}

void record_use(const begin_request& request) {
  const keymaster_key_param_t* const limit =
      key_param_set_find_next(request.key, KM_TAG_MIN_SECONDS_BETWEEN_OPS, nullptr);
  if (limit != nullptr) use_log_record(request.blob, limit->integer);
}

bool is_public_operation(uint32_t algorithm, uint32_t purpose) {
  return (algorithm == KM_ALGORITHM_RSA || algorithm == KM_ALGORITHM_EC) &&
         (purpose == KM_PURPOSE_ENCRYPT || purpose == KM_PURPOSE_VERIFY);
}

/// The decision on a restricted operation, step by step; the first that doesn't say KM_ERROR_OK is the answer.
keymaster_error_t decide(begin_request& request) {
  request.auth_timeout = key_param_set_get_unique(request.key, KM_TAG_AUTH_TIMEOUT);
  request.token = key_param_set_get_unique(request.in_params, KM_TAG_AUTH_TOKEN);
  if (request.token != nullptr &&
      check_auth_token_valid(request.token->blob.data, request.token->blob.data_length) != 0) {
    return KM_ERROR_INVALID_ARGUMENT;
  }
  request.user_auth_type = key_param_set_get_unique(request.key, KM_TAG_USER_AUTH_TYPE);
  request.no_auth_required = key_param_set_contains(request.key, KM_TAG_NO_AUTH_REQUIRED);

  keymaster_error_t error = read_requirements(request);
  if (error == KM_ERROR_OK) error = walk_characteristics(request);
  if (error == KM_ERROR_OK) error = check_requirements(request);
  if (error == KM_ERROR_OK) error = check_caller_nonce(request);
  if (error == KM_ERROR_OK) record_use(request);
  return error;
}

}  // namespace

TEE_Result authorize_begin(std::span<const uint8_t> blob, uint32_t purpose, const keymaster_key_param_set_t& in_params,
                           const keymaster_key_param_set_t& characteristics, keymaster_error_t* error) {
  const keymaster_key_param_t* const algorithm = key_param_set_get_unique(characteristics, KM_TAG_ALGORITHM);
  if (algorithm == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_ALGORITHM in key_params");
    *error = KM_ERROR_INVALID_KEY_BLOB;
    return TEE_SUCCESS;
  }
  *error = KM_ERROR_OK;
  if (is_public_operation(algorithm->enumerated, purpose)) return TEE_SUCCESS;

  begin_request request{
      .blob = blob, .algorithm = algorithm->enumerated, .in_params = in_params, .key = characteristics};
  request.purpose.value = purpose;
  *error = decide(request);
  return TEE_SUCCESS;
}

}  // namespace keymaster
