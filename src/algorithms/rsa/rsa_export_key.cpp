#include "algorithms/rsa/rsa_key.h"
#include "platform/handles.h"
#include "platform/trace.h"
#include "soter/resolve_key.h"
#include "tee_internal_api_extensions.h"

namespace keymaster {
namespace {

TEE_Result export_public_key(std::span<const uint8_t> key_data, uint8_t* output, uint32_t* output_length) {
  uint32_t key_size = 0;
  const object_handle key{resolve_key_from_data(key_data, &key_size)};
  if (!key) {
    TRACE_ERROR("resolve key from data stream error\n");
    return TEE_ERROR_GENERIC;
  }
  operation_handle operation;
  if (TEE_Result r = operation.allocate(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, key_size); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_AllocateOperation failed: %08x\n", r);
    return r;
  }
  if (TEE_Result r = TEE_SetOperationKey(operation.get(), key.get()); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_SetOperationKey failed: %08x\n", r);
    return r;
  }
  if (TEE_Result r = TEE_AsymmetricExport(operation.get(), TEE_EXPORT_FORMAT_SPKI_DER, output, output_length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_AsymmetricExport failed: %08x\n", r);
    return r;
  }
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result rsa_export_key(std::span<const uint8_t> key_data, uint8_t* output, uint32_t* output_length,
                          keymaster_error_t* error) {
  const bool exported = export_public_key(key_data, output, output_length) == TEE_SUCCESS;
  *error = exported ? KM_ERROR_OK : KM_ERROR_UNKNOWN_ERROR;
  return TEE_SUCCESS;
}

}  // namespace keymaster
