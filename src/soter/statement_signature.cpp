#include "soter/statement_signature.h"

#include "platform/bytes.h"
#include "platform/cursor.h"
#include "platform/handles.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t digest_capacity = 256;

}  // namespace

TEE_Result digest_and_sign(TEE_ObjectHandle key_object, uint32_t key_size, const void* message, uint32_t message_length,
                           uint8_t* signature, uint32_t* signature_length) {
  secret_bytes digest;
  if (!digest.allocate(digest_capacity)) return TEE_ERROR_OUT_OF_MEMORY;
  uint32_t digest_length = digest.size();
  if (TEE_Result r = do_digest_with_sha(TEE_ALG_SHA256, message, message_length, digest.data(), &digest_length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("digest message error 0x%x\n", r);
    return r;
  }
  if (TEE_Result r = do_sign_with_rsa(key_object, key_size, digest.data(), digest_length, signature, signature_length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("sign degist error 0x%x\n", r);
    return r;
  }
  return TEE_SUCCESS;
}

TEE_Result do_digest_with_sha(uint32_t algorithm, const void* message, uint32_t length, uint8_t* digest,
                              uint32_t* digest_length) {
  operation_handle operation;
  if (TEE_Result r = operation.allocate(algorithm, TEE_MODE_DIGEST, 0); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_AllocateOperation failed: %08x\n", r);
    return r;
  }
  const uint32_t capacity = *digest_length;
  TEE_DigestUpdate(operation.get(), message, length);
  TEE_Result result = TEE_DigestDoFinal(operation.get(), nullptr, 0, digest, digest_length);
  if (result == TEE_SUCCESS && *digest_length > capacity) result = TEE_ERROR_GENERIC;  // it can't have fitted
  if (result != TEE_SUCCESS) TRACE_ERROR("TEE_DigestDoFinal failed: %08x\n", result);
  return result;
}

TEE_Result do_sign_with_rsa(TEE_ObjectHandle key_object, uint32_t key_size, const uint8_t* digest,
                            uint32_t digest_length, uint8_t* signature, uint32_t* signature_length) {
  operation_handle operation;
  if (TEE_Result r = operation.allocate(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, TEE_MODE_SIGN, key_size); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_AllocateOperation failed: %08x\n", r);
    return r;
  }
  if (TEE_Result r = TEE_SetOperationKey(operation.get(), key_object); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_SetOperationKey failed: %08x\n", r);
    return r;
  }
  const uint32_t capacity = *signature_length;
  TEE_Result result =
      TEE_AsymmetricSignDigest(operation.get(), nullptr, 0, digest, digest_length, signature, signature_length);
  if (result == TEE_SUCCESS && *signature_length > capacity) result = TEE_ERROR_GENERIC;  // it can't have fitted
  if (result != TEE_SUCCESS) TRACE_ERROR("TEE_AsymmetricSignDigest failed: %08x\n", result);
  return result;
}

TEE_Result pack_statement(std::span<const uint8_t> text, std::span<const uint8_t> signature, uint8_t* output,
                          uint32_t* output_length) {
  if (packed_statement_size(text, signature) > *output_length) return TEE_ERROR_SHORT_BUFFER;
  const uint32_t text_size = static_cast<uint32_t>(text.size());
  byte_writer out{{output, *output_length}};
  if (!out.write_u32(text_size) || !out.write_bytes(text.data(), text_size) ||
      !out.write_bytes(signature.data(), static_cast<uint32_t>(signature.size()))) {
    return TEE_ERROR_SHORT_BUFFER;
  }
  *output_length = out.written();
  return TEE_SUCCESS;
}

}  // namespace keymaster
