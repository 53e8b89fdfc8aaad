#include "keystore/key_blob_layout.h"

#include <utility>

#include "platform/trace.h"

namespace keymaster {

TEE_Result start_blob_cipher(TEE_ObjectHandle ksk, std::span<const uint8_t> header, uint32_t mode, object_handle& key,
                             operation_handle& cipher) {
  TEE_ObjectHandle derived = TEE_HANDLE_NULL;
  const auto nonce = header.subspan<blob_nonce_offset, blob_nonce_size>();
  if (TEE_Result r = TEE_DeriveKK(ksk, nonce, &derived); r != TEE_SUCCESS) {
    TRACE_ERROR("DeriveKK failed with 0x%08x\n", r);
    return r;
  }
  object_handle blob_key{derived};
  operation_handle operation;
  if (TEE_Result r = operation.allocate(TEE_ALG_AES_GCM, mode, ksk_bits); r != TEE_SUCCESS) {
    TRACE_ERROR("AllocateOperation failed with 0x%08x\n", r);
    return r;
  }
  if (TEE_Result r = TEE_SetOperationKey(operation.get(), blob_key.get()); r != TEE_SUCCESS) {
    TRACE_ERROR("SetOperationKey failed with 0x%08x\n", r);
    return r;
  }
  const auto iv = header.subspan<blob_iv_offset, blob_iv_size>();
  if (TEE_Result r = TEE_AEInit(operation.get(), iv.data(), blob_iv_size, blob_tag_size * 8, 0, 0); r != TEE_SUCCESS) {
    TRACE_ERROR("AEInit failed with 0x%08x\n", r);
    return r;
  }
  key = std::move(blob_key);
  cipher = std::move(operation);
  return TEE_SUCCESS;
}

}  // namespace keymaster
