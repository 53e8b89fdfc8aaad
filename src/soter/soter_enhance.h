// What keys of the soter framework do instead of a plain export and a plain signature: signed statements.
#ifndef KEYMASTER_SOTER_SOTER_ENHANCE_H_
#define KEYMASTER_SOTER_SOTER_ENHANCE_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// soter_enhance_sign_finish signs a statement about `message` with `key`; `digest_operation` is the one that begin
/// made. TEE_ERROR_NOT_IMPLEMENTED, and `output` stays empty.
[[nodiscard]] TEE_Result soter_enhance_sign_finish(TEE_ObjectHandle key, TEE_OperationHandle digest_operation,
                                                   const keymaster_key_param_set_t& in_params,
                                                   std::span<const uint8_t> message, secret_bytes& output);

/// soter_enhance_export_key writes a signed statement about a soter key to `output`; `*output_length` is the capacity
/// on entry, the size on return. TEE_ERROR_NOT_IMPLEMENTED, with `*output_length` 0.
[[nodiscard]] TEE_Result soter_enhance_export_key(std::span<const uint8_t> key_data,
                                                  const keymaster_key_param_set_t& characteristics, uint8_t* output,
                                                  uint32_t* output_length);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_ENHANCE_H_
