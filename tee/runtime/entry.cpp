// The entry layer: where the header record of an image points. The secure world enters a TA through it, with the TA's
// instance current.
#include "tee/runtime/ta_instance.h"

namespace hosted_tee {
namespace {

// Images are entered by the secure world alone, and all of its instances are ta_instances.
ta_instance& entered_instance() {
  return static_cast<ta_instance&>(current_instance());
}

TEE_Result create_if_new(ta_instance& ta) {
  if (ta.created) return TEE_SUCCESS;
  const TEE_Result result = ta.code().create();
  ta.created = result == TEE_SUCCESS;
  return result;
}

void destroy_if_unused(ta_instance& ta) {
  if (ta.open_sessions != 0 || ta.is_kept_alive()) return;
  ta.code().destroy();
  ta.created = false;
}

}  // namespace

extern "C" {

TEE_Result tee_entry_open_session(uint32_t paramTypes, TEE_Param params[4], void** sessionContext) {
  ta_instance& ta = entered_instance();
  if (const TEE_Result result = create_if_new(ta); result != TEE_SUCCESS) return result;
  const TEE_Result result = ta.code().open_session(paramTypes, params, sessionContext);
  if (result == TEE_SUCCESS) {
    ++ta.open_sessions;
  } else {
    destroy_if_unused(ta);
  }
  return result;
}

void tee_entry_close_session(void* sessionContext) {
  ta_instance& ta = entered_instance();
  ta.code().close_session(sessionContext);
  --ta.open_sessions;
  destroy_if_unused(ta);
}

TEE_Result tee_entry_invoke_command(void* sessionContext, uint32_t commandID, uint32_t paramTypes,
                                    TEE_Param params[4]) {
  return entered_instance().code().invoke(sessionContext, commandID, paramTypes, params);
}

}  // extern "C"
}  // namespace hosted_tee
