#include "platform/trace.h"
#include "soter/json_writer.h"
#include "soter/soter_enhance.h"
#include "soter/statement_signature.h"
#include "soter/text.h"

namespace keymaster {
namespace {

uint32_t uid_of(const keymaster_key_param_set_t& authorization_set) {
  const keymaster_key_param_t* const uid = key_param_set_get_unique(authorization_set, KM_TAG_SOTER_UID);
  if (uid == nullptr) return soter_no_uid;
  TRACE_DEBUG("soter key has uid\n");
  return uid->integer;
}

TEE_Result pack(std::span<const uint8_t> statement, std::span<const uint8_t> signature, secret_bytes& output) {
  const uint64_t size = packed_statement_size(statement, signature);
  if (size > UINT32_MAX || !output.allocate(static_cast<uint32_t>(size))) {
    TRACE_ERROR("Out of memory for output");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  uint32_t length = output.size();
  return pack_statement(statement, signature, output.data(), &length);
}

}  // namespace

TEE_Result soter_enhance_sign_finish(const soter_signer& op, const keymaster_key_param_set_t& in_params,
                                     std::span<const uint8_t> raw, secret_bytes& output) {
  output.reset();
  // A statement is signed by its digest. This comes first, so that it costs no counter value.
  if (op.digest_operation == TEE_HANDLE_NULL) return TEE_ERROR_NOT_SUPPORTED;
  TEE_Result result = TEE_SUCCESS;
  const json_text text{produce_soter_sign_json(raw, uid_of(op.authorization_set), &result)};
  if (!text) {
    TRACE_ERROR("produce json string error");
    return result == TEE_SUCCESS ? TEE_ERROR_GENERIC : result;
  }
  const std::span<const uint8_t> without_nul = text_bytes(text.get());
  const std::span<const uint8_t> statement{without_nul.data(), without_nul.size() + 1};
  secret_bytes signature;
  if (TEE_Result r = soter_do_sign_finish(op, in_params, statement, signature); r != TEE_SUCCESS) return r;
  return pack(statement, signature.span(), output);
}

TEE_Result soter_do_sign_finish(const soter_signer& op, const keymaster_key_param_set_t& /*in_params*/,
                                std::span<const uint8_t> statement, secret_bytes& signature) {
  const uint32_t modulus_size = static_cast<uint32_t>(op.buffer.size());
  uint32_t digest_length = modulus_size;
  TEE_Result digested = TEE_DigestDoFinal(op.digest_operation, statement.data(),
                                          static_cast<uint32_t>(statement.size()), op.buffer.data(), &digest_length);
  if (digested == TEE_SUCCESS && digest_length > modulus_size) digested = TEE_ERROR_GENERIC;  // it can't have fitted
  if (digested != TEE_SUCCESS) {
    TRACE_ERROR("DigestDoFinal failed with 0x%08x\n", digested);
    return digested;
  }
  if (!signature.allocate(modulus_size)) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  uint32_t length = signature.size();
  TEE_Result result = TEE_AsymmetricSignDigest(op.operation, op.salt, op.salt == nullptr ? 0 : 1, op.buffer.data(),
                                               digest_length, signature.data(), &length);
  if (result == TEE_SUCCESS && length > modulus_size) result = TEE_ERROR_GENERIC;  // it can't have fitted
  if (result != TEE_SUCCESS) {
    TRACE_ERROR("AsymmetricSignDigest failed with 0x%08x\n", result);
    return result;
  }
  signature.shorten(length);
  return TEE_SUCCESS;
}

}  // namespace keymaster
