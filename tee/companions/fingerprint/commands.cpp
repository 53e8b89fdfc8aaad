// The commands of the fingerprint TA.
#include "platform/trace.h"
#include "tee/companions/common/auth_token_mint.h"
#include "tee/companions/common/command_table.h"
#include "tee/companions/common/fixed_object.h"
#include "tee/companions/fingerprint/finger_list.h"
#include "tee/companions/fingerprint/fingerprint_protocol.h"
#include "tee/companions/fingerprint/keymaster_notice.h"

namespace keymaster::fingerprint {
namespace {

using companion::caller_rule;

/// A number of 64 bits in a value slot.
uint64_t wide(const TEE_Param& slot) {
  return uint64_t{slot.value.b} << 32 | slot.value.a;
}

TEE_Result enrol(TEE_Param params[4]) {
  const uint64_t secure_id = wide(params[0]);
  if (secure_id == 0) {
    TRACE_ERROR("A finger is somebody's\n");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  finger_list fingers;
  if (TEE_Result r = fingers.load(); r != TEE_SUCCESS) return r;
  return fingers.enrol(secure_id, &params[1].value.a);
}

TEE_Result mint(uint32_t finger, uint64_t challenge, uint64_t time_ms,
                std::span<uint8_t, companion::auth_token_size> token) {
  companion::auth_token_claim claim = {
      .challenge = challenge, .authenticator_type = companion::AUTHENTICATOR_FINGERPRINT, .time_ms = time_ms};
  finger_list fingers;
  if (TEE_Result r = fingers.load(); r != TEE_SUCCESS) return r;
  if (TEE_Result r = fingers.find(finger, &claim.secure_id); r != TEE_SUCCESS) return r;
  if (TEE_Result r = companion::draw_id_once("fp.authid", &claim.authenticator_id); r != TEE_SUCCESS) return r;
  return companion::mint_auth_token(claim, token);
}

/// The Keymaster TA is told once there is a token, so that a touch that fails has told nobody anything. What it says to
/// the news is the client's to know, and spoils no token: keys that don't ask for a finger id go without.
TEE_Result touch(TEE_Param params[4]) {
  if (TEE_Result r = companion::check_room(params[2], companion::auth_token_size); r != TEE_SUCCESS) return r;
  const uint32_t finger = params[0].value.a;
  const uint64_t now = companion::system_time_ms();
  uint8_t token[companion::auth_token_size];
  const TEE_Result result = mint(finger, wide(params[1]), now, token);
  if (result == TEE_SUCCESS) params[3].value.a = tell_keymaster(finger, now);
  return companion::answer_outcome(params[2], result, token);
}

TEE_Result remove(TEE_Param params[4]) {
  finger_list fingers;
  if (TEE_Result r = fingers.load(); r != TEE_SUCCESS) return r;
  return fingers.remove(params[0].value.a);
}

TEE_Result list(TEE_Param params[4]) {
  finger_list fingers;
  if (TEE_Result r = fingers.load(); r != TEE_SUCCESS) return companion::answer_outcome(params[0], r, {});
  return companion::answer_bytes(params[0], fingers.records());
}

constexpr companion::command_row rows[] = {
    {COMMAND_ENROL, "enrol", TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INPUT, TEE_PARAM_TYPE_VALUE_OUTPUT, 0, 0),
     caller_rule::normal_world, enrol},
    {COMMAND_TOUCH, "touch",
     TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INPUT, TEE_PARAM_TYPE_VALUE_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT,
                     TEE_PARAM_TYPE_VALUE_OUTPUT),
     caller_rule::normal_world, touch},
    {COMMAND_REMOVE, "remove", TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INPUT, 0, 0, 0), caller_rule::normal_world, remove},
    {COMMAND_LIST, "list", TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_OUTPUT, 0, 0, 0), caller_rule::normal_world, list},
};

}  // namespace
}  // namespace keymaster::fingerprint

constinit const std::span<const keymaster::companion::command_row> keymaster::companion::commands =
    keymaster::fingerprint::rows;
