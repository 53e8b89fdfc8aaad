// The entry points that the platform calls, the same for every companion: all it does, it does in its commands.
#include "tee/companions/common/command_table.h"

TEE_Result TA_CreateEntryPoint(void) {
  return TEE_SUCCESS;
}

void TA_DestroyEntryPoint(void) {}

TEE_Result TA_OpenSessionEntryPoint(uint32_t /*paramTypes*/, TEE_Param /*params*/[4], void** /*sessionContext*/) {
  return TEE_SUCCESS;
}

void TA_CloseSessionEntryPoint(void* /*sessionContext*/) {}

TEE_Result TA_InvokeCommandEntryPoint(void* /*sessionContext*/, uint32_t commandID, uint32_t paramTypes,
                                      TEE_Param params[4]) {
  return keymaster::companion::dispatch(keymaster::companion::commands, commandID, paramTypes, params);
}
