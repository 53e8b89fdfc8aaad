#include "tee/companions/common/caller.h"

#include <cstring>

#include "params/keymaster_protocol.h"
#include "platform/trace.h"

namespace keymaster::companion {
namespace {

constexpr TEE_UUID keymaster_uuid = KEYMASTER_TA_UUID;

bool allowed(caller_rule rule, const TEE_Identity& client) {
  const bool is_ta = client.login == TEE_LOGIN_TRUSTED_APP;
  switch (rule) {
    case caller_rule::anybody:
      return true;
    case caller_rule::normal_world:
      return !is_ta;
    case caller_rule::keymaster_ta:
      return is_ta && std::memcmp(&client.uuid, &keymaster_uuid, sizeof keymaster_uuid) == 0;
  }
  return false;
}

}  // namespace

TEE_Result check_caller(caller_rule rule) {
  if (rule == caller_rule::anybody) return TEE_SUCCESS;
  TEE_Identity client = {};
  const TEE_Result result = TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", &client);
  if (result != TEE_SUCCESS) {
    TRACE_ERROR("Get client identity failed with 0x%08x\n", result);
    return result;
  }
  if (allowed(rule, client)) return TEE_SUCCESS;
  TRACE_ERROR("Refused to a client of login 0x%08x\n", client.login);
  return TEE_ERROR_ACCESS_DENIED;
}

}  // namespace keymaster::companion
