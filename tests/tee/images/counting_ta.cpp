// A TA image whose answers show whether its static data is fresh.
#include "tee_internal_api_extensions.h"
#include "tee_ta_image.h"

namespace {

uint32_t invocations;  // zero in every new instance

}  // namespace

extern "C" {

const char tee_trace_prefix[] = "COUNTING";

const tee_ta_property ta_properties[] = {
    {"gpd.ta.dataSize", TEE_TA_PROPERTY_U32, 1024, nullptr},
    {nullptr, 0, 0, nullptr},
};

const tee_ta_head ta_head = {
    COUNTING_TA_UUID,         0x2000, COUNTING_TA_FLAGS, tee_entry_open_session, tee_entry_close_session,
    tee_entry_invoke_command,
};

TEE_Result TA_CreateEntryPoint(void) {
  tee_trace("create", 1, TEE_TRACE_INFO, "created");
  return TEE_SUCCESS;
}

void TA_DestroyEntryPoint(void) {
  tee_trace("destroy", 2, TEE_TRACE_INFO, "destroyed");
}

TEE_Result TA_OpenSessionEntryPoint(uint32_t /*types*/, TEE_Param* /*params*/, void** /*context*/) {
  return TEE_SUCCESS;
}

void TA_CloseSessionEntryPoint(void* /*context*/) {}

// Command 0 counts itself; command 1 panics; command 2 allocates as many bytes as value a tells.
TEE_Result TA_InvokeCommandEntryPoint(void* /*context*/, uint32_t command, uint32_t /*types*/, TEE_Param* params) {
  if (command == 1) TEE_Panic(7);
  if (command == 2) return TEE_Malloc(params[0].value.a, 0) == nullptr ? TEE_ERROR_OUT_OF_MEMORY : TEE_SUCCESS;
  params[0].value.a = ++invocations;
  return TEE_SUCCESS;
}

}  // extern "C"
