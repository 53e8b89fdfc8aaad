#include "tee/companions/fingerprint/keymaster_notice.h"

#include "params/keymaster_protocol.h"
#include "platform/cursor.h"
#include "platform/handles.h"
#include "platform/trace.h"

namespace keymaster::fingerprint {
namespace {

constexpr TEE_UUID keymaster_ta = KEYMASTER_TA_UUID;

}  // namespace

TEE_Result tell_keymaster(uint32_t finger, uint64_t time_ms) {
  uint8_t message[SOTER_FID_MESSAGE_SIZE];
  byte_writer out{message};
  if (!out.write_u32(SOTER_FID_MESSAGE_VERSION) || !out.write_u32(finger) ||
      !out.write_bytes(&time_ms, sizeof time_ms)) {
    return TEE_ERROR_BAD_STATE;
  }
  ta_session session;
  if (TEE_Result r = session.open(keymaster_ta); r != TEE_SUCCESS) {
    TRACE_ERROR("OpenTASession failed with 0x%08x\n", r);
    return r;
  }
  TEE_Param params[4] = {};
  params[1].memref.buffer = message;
  params[1].memref.size = sizeof message;
  const TEE_Result result =
      session.invoke(KM_COMMAND_SOTER_SET_FID, TEE_PARAM_TYPES(0, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0), params);
  if (result != TEE_SUCCESS) TRACE_ERROR("The Keymaster TA answered 0x%08x\n", result);
  return result;
}

}  // namespace keymaster::fingerprint
