#include "algorithms/rsa/rsa_sign.h"

#include <algorithm>
#include <cstring>
#include <utility>

#include "algorithms/rsa/rsa_signature_scheme.h"
#include "params/operation_record.h"
#include "platform/trace.h"
#include "soter/soter_enhance.h"
#include "soter/soter_init.h"

namespace keymaster {
namespace {

constexpr uint32_t soter_start_capacity = 4096;
/// Beyond its capacity the buffer has a zero byte, so that even a full one can be read as text.
constexpr uint32_t soter_nul = 1;

/// Salt lengths as the platform reads them: as long as the digest, or as long as the key allows.
constexpr uint32_t pss_salt_as_digest = static_cast<uint32_t>(-1);
constexpr uint32_t pss_salt_longest = static_cast<uint32_t>(-2);

rsa_sign_operation_t& record(keymaster_operation_t* op) {
  return *static_cast<rsa_sign_operation_t*>(op);
}

keymaster_error_t prepare_soter(rsa_sign_operation_t& op, const keymaster_key_param_set_t& characteristics) {
  if (!key_param_set_contains(characteristics, KM_TAG_SOTER_KEY)) return KM_ERROR_OK;
  TRACE_DEBUG("sign from soter, allocate raw message buffer");
  if (TEE_Result r = soter_ensure_ready(); r != TEE_SUCCESS) {
    TRACE_ERROR("soter resources is not ready, error 0x%x\n", r);
    return KM_ERROR_UNKNOWN_ERROR;
  }
  if (!op.soter_buffer.allocate(soter_start_capacity + soter_nul)) {
    TRACE_ERROR("No memory for soter");
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  op.soter_capacity = soter_start_capacity;
  return KM_ERROR_OK;
}

/// Makes room for `needed` bytes of message, at least doubling the buffer.
keymaster_error_t expand_soter_buffer(rsa_sign_operation_t& op, uint64_t needed) {
  const uint64_t wanted = std::max(needed, uint64_t{op.soter_capacity} * 2);
  const uint32_t size = static_cast<uint32_t>(std::min<uint64_t>(wanted, UINT32_MAX));
  secret_bytes larger;
  if (wanted + soter_nul > UINT32_MAX || !larger.allocate(size + soter_nul)) {
    TRACE_ERROR("no memory to expand soter buf %u", size);
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  TRACE_DEBUG("expand soter buf %u -> %d", op.soter_capacity, size);
  std::memcpy(larger.data(), op.soter_buffer.data(), op.soter_length);
  op.soter_buffer = std::move(larger);
  op.soter_capacity = size;
  return KM_ERROR_OK;
}

keymaster_error_t gather_soter(rsa_sign_operation_t& op, std::span<const uint8_t> input) {
  TRACE_DEBUG("sign update is from soter");
  const uint64_t needed = uint64_t{op.soter_length} + input.size();
  if (needed > op.soter_capacity) {
    if (const keymaster_error_t error = expand_soter_buffer(op, needed); error != KM_ERROR_OK) return error;
  }
  if (!input.empty()) std::memcpy(op.soter_buffer.data() + op.soter_length, input.data(), input.size());
  op.soter_length = static_cast<uint32_t>(needed);
  return KM_ERROR_OK;
}

/// The salt is as long as the digest where the key leaves room for both, and otherwise as long as it can be.
TEE_Attribute pss_salt(const rsa_sign_operation_t& op) {
  const uint64_t both = 2 * (uint64_t{digest_size(op.digest)} + 1);
  TEE_Attribute salt;
  TEE_InitValueAttribute(&salt, TEE_ATTR_RSA_PSS_SALT_LENGTH,
                         both <= op.modulus_size() ? pss_salt_as_digest : pss_salt_longest, 0);
  return salt;
}

TEE_Result sign_digest(rsa_sign_operation_t& op, secret_bytes& signature, uint32_t* length, keymaster_error_t* error) {
  uint32_t digest_length = 0;
  if (TEE_Result r = finish_digest(op, &digest_length); r != TEE_SUCCESS) return r;
  if (!signature.allocate(op.modulus_size())) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  const TEE_Attribute salt = pss_salt(op);
  const bool pss = op.padding == KM_PAD_RSA_PSS;
  *length = signature.size();
  const TEE_Result result = TEE_AsymmetricSignDigest(op.operation.get(), pss ? &salt : nullptr, pss ? 1 : 0,
                                                     op.buffer.data(), digest_length, signature.data(), length);
  if (result != TEE_SUCCESS) TRACE_ERROR("AsymmetricSignDigest failed with 0x%08x\n", result);
  return result;
}

TEE_Result sign_raw(rsa_sign_operation_t& op, secret_bytes& signature, uint32_t* length, keymaster_error_t* error) {
  if (!signature.allocate(op.modulus_size())) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  if (op.padding == KM_PAD_NONE) {
    right_align(op.buffer.span(), op.buffered);
  } else if (!build_pkcs1_block(op)) {
    *error = KM_ERROR_INVALID_INPUT_LENGTH;
    return TEE_SUCCESS;
  }
  *length = signature.size();
  const TEE_Result result = TEE_AsymmetricDecrypt(op.operation.get(), nullptr, 0, op.buffer.data(), op.buffer.size(),
                                                  signature.data(), length);
  if (result == TEE_ERROR_BAD_PARAMETERS) {  // the message is no number below the modulus: the client's fault
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  if (result != TEE_SUCCESS) TRACE_ERROR("TEE_AsymmetricDecrypt return 0x%08x", result);
  return result;
}

TEE_Result sign_statement(rsa_sign_operation_t& op, const keymaster_key_param_set_t& in_params, secret_bytes& output,
                          keymaster_error_t* error) {
  TRACE_DEBUG("sign finish is from soter");
  const TEE_Attribute salt = pss_salt(op);
  const soter_signer signer = {op.authorization_set, op.operation.get(), op.digest_operation.get(), op.buffer.span(),
                               op.padding == KM_PAD_RSA_PSS ? &salt : nullptr};
  const TEE_Result result =
      soter_enhance_sign_finish(signer, in_params, {op.soter_buffer.data(), op.soter_length}, output);
  if (result != TEE_SUCCESS) {
    TRACE_ERROR("soter enhance error %x", result);
    output.reset();
    *error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

}  // namespace

keymaster_operation_t* create_rsa_sign(const operation_request& request, TEE_Result* result, keymaster_error_t* error) {
  return make_record<rsa_sign_operation_t>(
      {KM_PURPOSE_SIGN, rsa_sign_free, rsa_sign_update, rsa_sign_finish}, result, error,
      [&](rsa_sign_operation_t& op) {
        *error = prepare_soter(op, request.characteristics);
        return *error == KM_ERROR_OK ? prepare_signature_operation(op, request, error) : TEE_SUCCESS;
      },
      KM_ERROR_MEMORY_ALLOCATION_FAILED);
}

TEE_Result rsa_sign_update(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                           std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* /*output*/,
                           uint32_t* output_length, keymaster_error_t* error) {
  rsa_sign_operation_t& sign = record(op);
  *output_length = 0;
  *error = KM_ERROR_OK;
  uint32_t total = 0;
  if (sign.soter_buffer) {
    *error = gather_soter(sign, input);
  } else if (!update_signature_operation(sign, input, &total)) {
    TRACE_ERROR("Input too long to sign, key_size %d, input %dB", sign.key_size, total);
    *input_consumed = 0;
    *error = KM_ERROR_INVALID_INPUT_LENGTH;
  }
  return TEE_SUCCESS;
}

TEE_Result rsa_sign_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                           std::span<const uint8_t> /*input*/, secret_bytes& output, parameter_set& /*out_params*/,
                           keymaster_error_t* error) {
  rsa_sign_operation_t& sign = record(op);
  *error = KM_ERROR_OK;
  if (sign.soter_buffer) return sign_statement(sign, in_params, output, error);

  secret_bytes signature;
  uint32_t length = 0;
  const TEE_Result result =
      sign.digest_operation ? sign_digest(sign, signature, &length, error) : sign_raw(sign, signature, &length, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) return result;
  right_align(signature.span(), length);
  output = std::move(signature);
  return TEE_SUCCESS;
}

void rsa_sign_free(keymaster_operation_t* op) {
  auto* const sign = static_cast<rsa_sign_operation_t*>(op);
  if (sign == nullptr) {
    TRACE_ERROR("Try to free NULL rsa_sign_operation_t");
    return;
  }
  for (uint32_t n = missing_members(*sign); n > 0; --n) TRACE_ERROR("Try to free invalid rsa_sign_operation_t");
  delete_record(sign);
}

}  // namespace keymaster
