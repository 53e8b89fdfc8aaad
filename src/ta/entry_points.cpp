// The entry points that the platform calls, one command at a time.
#include "auth/authorization.h"
#include "auth/operation_pool.h"
#include "keystore/key_storage_key.h"
#include "platform/trace.h"
#include "soter/soter_init.h"
#include "ta/dispatch.h"

const char tee_trace_prefix[] = "KEYMASTER";

TEE_Result TA_CreateEntryPoint(void) {
  keymaster::soter_start();
  if (TEE_Result r = keymaster::key_store_init(); r != TEE_SUCCESS) {
    TRACE_ERROR("Init key store failed");
    return r;
  }
  if (TEE_Result r = keymaster::operation_pool_init(); r != TEE_SUCCESS) {
    TRACE_ERROR("Init operation pool failed");
    keymaster::key_store_release();
    return r;
  }
  if (TEE_Result r = keymaster::authorizaiton_init(); r != TEE_SUCCESS) {
    TRACE_ERROR("Init authorization failed");
    keymaster::key_store_release();
    return r;
  }
  return TEE_SUCCESS;
}

void TA_DestroyEntryPoint(void) {
  keymaster::authorizaiton_release();
  if (keymaster::soter_ready()) keymaster::soter_release_resources();
}

TEE_Result TA_OpenSessionEntryPoint(uint32_t /*paramTypes*/, TEE_Param /*params*/[4], void** /*sessionContext*/) {
  return TEE_SUCCESS;
}

void TA_CloseSessionEntryPoint(void* /*sessionContext*/) {}

TEE_Result TA_InvokeCommandEntryPoint(void* sessionContext, uint32_t commandID, uint32_t paramTypes,
                                      TEE_Param params[4]) {
  TRACE_INFO("TA_InvokeCommandEntryPoint nCommandID 0x%x pSessionContext %p nParamTypes 0x%x\n", commandID,
             sessionContext, paramTypes);
  return keymaster::dispatch(commandID, paramTypes, params);
}
