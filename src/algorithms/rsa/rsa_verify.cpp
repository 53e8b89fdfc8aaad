#include "algorithms/rsa/rsa_verify.h"

#include <cstring>

#include "algorithms/rsa/rsa_signature_scheme.h"
#include "params/operation_record.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

/// Any salt length is accepted: the platform recovers it from the signature.
constexpr uint32_t pss_salt_recovered = static_cast<uint32_t>(-2);

rsa_verify_operation_t& record(keymaster_operation_t* op) {
  return *static_cast<rsa_verify_operation_t*>(op);
}

TEE_Result verify_digest(rsa_verify_operation_t& op, std::span<const uint8_t> signature, keymaster_error_t* error) {
  uint32_t digest_length = 0;
  if (TEE_Result r = finish_digest(op, &digest_length); r != TEE_SUCCESS) return r;
  TEE_Attribute salt;
  TEE_InitValueAttribute(&salt, TEE_ATTR_RSA_PSS_SALT_LENGTH, pss_salt_recovered, 0);
  const bool pss = op.padding == KM_PAD_RSA_PSS;
  const TEE_Result result =
      TEE_AsymmetricVerifyDigest(op.operation.get(), pss ? &salt : nullptr, pss ? 1 : 0, op.buffer.data(),
                                 digest_length, signature.data(), static_cast<uint32_t>(signature.size()));
  if (result != TEE_ERROR_SIGNATURE_INVALID) return result;
  *error = KM_ERROR_VERIFICATION_FAILED;
  return TEE_SUCCESS;
}

/// Compares the public operation's result with the block. The platform drops the leading zero byte of the block that
/// was signed, so the result must be one byte shorter, and the block's first byte is not compared.
bool matches_block(const rsa_verify_operation_t& op, const secret_bytes& recovered, uint32_t length) {
  const uint32_t k = op.modulus_size();
  return k != 0 && length == k - 1 && std::memcmp(recovered.data(), op.buffer.data() + 1, k - 1) == 0;
}

TEE_Result verify_raw(rsa_verify_operation_t& op, secret_bytes& recovered, std::span<const uint8_t> signature,
                      keymaster_error_t* error) {
  // Without padding the message stands as it was gathered, at the start of the block: only a whole block can match.
  if (op.padding == KM_PAD_RSA_PKCS1_1_5_SIGN && !build_pkcs1_block(op)) {
    *error = KM_ERROR_INVALID_INPUT_LENGTH;
    return TEE_SUCCESS;
  }
  uint32_t length = recovered.size();
  if (TEE_Result r = TEE_AsymmetricEncrypt(op.operation.get(), nullptr, 0, signature.data(),
                                           static_cast<uint32_t>(signature.size()), recovered.data(), &length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("AsymmetricEncrypt failed with 0x%08x\n", r);
    return r;
  }
  if (!matches_block(op, recovered, length)) *error = KM_ERROR_VERIFICATION_FAILED;
  return TEE_SUCCESS;
}

}  // namespace

keymaster_operation_t* create_rsa_verify(const operation_request& request, TEE_Result* result,
                                         keymaster_error_t* error) {
  return make_record<rsa_verify_operation_t>(
      {KM_PURPOSE_VERIFY, rsa_verify_free, rsa_verify_update, rsa_verify_finish}, result, error,
      [&](rsa_verify_operation_t& op) { return prepare_signature_operation(op, request, error); },
      KM_ERROR_MEMORY_ALLOCATION_FAILED);
}

TEE_Result rsa_verify_update(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                             std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* /*output*/,
                             uint32_t* output_length, keymaster_error_t* error) {
  rsa_verify_operation_t& verify = record(op);
  uint32_t total = 0;
  *output_length = 0;
  *error = KM_ERROR_OK;
  if (!update_signature_operation(verify, input, &total)) {
    TRACE_ERROR("Input too long to verify, key_size %d, input %dB", verify.key_size, total);
    *input_consumed = 0;
    *error = KM_ERROR_INVALID_INPUT_LENGTH;
  }
  return TEE_SUCCESS;
}

TEE_Result rsa_verify_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                             std::span<const uint8_t> input, secret_bytes& /*output*/, parameter_set& /*out_params*/,
                             keymaster_error_t* error) {
  rsa_verify_operation_t& verify = record(op);
  *error = KM_ERROR_OK;
  secret_bytes recovered;
  heap_bytes signature;
  if (!recovered.allocate(verify.modulus_size()) || !signature.copy_of(input)) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  return verify.digest_operation ? verify_digest(verify, signature.span(), error)
                                 : verify_raw(verify, recovered, signature.span(), error);
}

void rsa_verify_free(keymaster_operation_t* op) {
  auto* const verify = static_cast<rsa_verify_operation_t*>(op);
  if (verify == nullptr) {
    TRACE_ERROR("Try to free NULL rsa_verify_operation_t");
    return;
  }
  for (uint32_t n = missing_members(*verify); n > 0; --n) TRACE_ERROR("Try to free invalid rsa_verify_operation_t");
  delete_record(verify);
}

}  // namespace keymaster
