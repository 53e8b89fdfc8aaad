#include "soter/soter_handlers.h"

namespace keymaster {

TEE_Result soter_handle_generate_attk_key_pair(uint32_t, TEE_Param*) {
  return TEE_ERROR_NOT_IMPLEMENTED;
}

TEE_Result soter_handle_verify_attk_key_pair(TEE_Param*) {
  return TEE_ERROR_NOT_IMPLEMENTED;
}

TEE_Result soter_handle_export_attk_public_key(TEE_Param*, TEE_Param*) {
  return TEE_ERROR_NOT_IMPLEMENTED;
}

TEE_Result soter_handle_get_device_id(TEE_Param*, TEE_Param*) {
  return TEE_ERROR_NOT_IMPLEMENTED;
}

TEE_Result soter_handle_setFid(const void*, uint32_t) {
  return TEE_ERROR_NOT_IMPLEMENTED;
}

}  // namespace keymaster
