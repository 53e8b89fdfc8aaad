#include "soter/soter_enhance.h"

namespace keymaster {

TEE_Result soter_enhance_sign_finish(TEE_ObjectHandle /*key*/, TEE_OperationHandle /*digest_operation*/,
                                     const keymaster_key_param_set_t& /*in_params*/,
                                     std::span<const uint8_t> /*message*/, secret_bytes& output) {
  output.reset();
  return TEE_ERROR_NOT_IMPLEMENTED;
}

TEE_Result soter_enhance_export_key(std::span<const uint8_t> /*key_data*/,
                                    const keymaster_key_param_set_t& /*characteristics*/, uint8_t* /*output*/,
                                    uint32_t* output_length) {
  *output_length = 0;
  return TEE_ERROR_NOT_IMPLEMENTED;
}

}  // namespace keymaster
