#include "algorithms/rsa/rsa_cipher.h"

#include <array>

#include "algorithms/rsa/rsa_signature_scheme.h"
#include "params/operation_record.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

/// OAEP by digest; 0: not defined with it. The platform knows these identifiers beside the standard ones, from which
/// they differ by the bit 0x2000: with them MGF1 runs on SHA-1 whatever the digest, which is what clients pair OAEP
/// with.
constexpr std::array<uint32_t, 7> oaep_algorithms = {0, 0, 0x60212230, 0x60312230, 0x60412230, 0x60512230, 0x60612230};

constexpr int64_t pkcs1_overhead = 11;

using asymmetric_function = TEE_Result (*)(TEE_OperationHandle, const TEE_Attribute*, uint32_t, const void*, uint32_t,
                                           void*, uint32_t*);

/// In what the two directions differ, besides their names.
struct direction {
  uint32_t mode;
  asymmetric_function function;
  bool limits_message;  // the paddings need room; a ciphertext has its size already
  bool always_right_aligns;
};

constexpr direction encryption = {TEE_MODE_ENCRYPT, TEE_AsymmetricEncrypt, true, true};
constexpr direction decryption = {TEE_MODE_DECRYPT, TEE_AsymmetricDecrypt, false, false};

/// A padding that is not one comes first, then a digest beyond those known, then one that does not fit.
keymaster_error_t choose_cipher(uint32_t padding, uint32_t digest, uint32_t* algorithm) {
  switch (padding) {
    case KM_PAD_RSA_OAEP:
      *algorithm = digest < oaep_algorithms.size() ? oaep_algorithms[digest] : 0;
      break;
    case KM_PAD_RSA_PKCS1_1_5_ENCRYPT:
      *algorithm = digest == KM_DIGEST_NONE ? TEE_ALG_RSAES_PKCS1_V1_5 : 0;
      break;
    case KM_PAD_NONE:
      *algorithm = digest == KM_DIGEST_NONE ? TEE_ALG_RSA_NOPAD : 0;
      break;
    default:
      return KM_ERROR_UNSUPPORTED_PADDING_MODE;
  }
  if (*algorithm != 0) return KM_ERROR_OK;
  return digest < oaep_algorithms.size() ? KM_ERROR_INCOMPATIBLE_DIGEST : KM_ERROR_UNSUPPORTED_DIGEST;
}

TEE_Result prepare(rsa_operation_t& op, const operation_request& request, const direction& way,
                   keymaster_error_t* error) {
  if (TEE_Result r = resolve_rsa_key(op, request.key_data, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  const keymaster_key_param_t* const padding = key_param_set_get_unique(request.in_params, KM_TAG_PADDING);
  if (padding == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_PADDING");
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  const keymaster_key_param_t* const digest = key_param_set_get_unique(request.in_params, KM_TAG_DIGEST);
  op.padding = padding->enumerated;
  op.digest = digest == nullptr ? KM_DIGEST_NONE : digest->enumerated;
  uint32_t algorithm = 0;
  *error = choose_cipher(op.padding, op.digest, &algorithm);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  return set_rsa_operation(op, algorithm, way.mode);
}

/// Whether the padding has room for the message. The limit may be negative: a short key has none for a long digest.
keymaster_error_t check_message_fits(const rsa_operation_t& op) {
  const int64_t k = op.modulus_size();
  int64_t limit = k;
  if (op.padding == KM_PAD_RSA_PKCS1_1_5_ENCRYPT) limit = k - pkcs1_overhead;
  if (op.padding == KM_PAD_RSA_OAEP) {
    const int64_t h = digest_size(op.digest);
    if (op.digest < KM_DIGEST_SHA1 || h == 0) {
      TRACE_ERROR("Unknown digest %d", op.digest);
      return KM_ERROR_INCOMPATIBLE_DIGEST;
    }
    limit = k - 2 * h - 2;
  }
  if (op.padding == KM_PAD_NONE || int64_t{op.buffered} <= limit) return KM_ERROR_OK;
  TRACE_ERROR("Message too long, max %dB, got %dB", static_cast<int32_t>(limit), op.buffered);
  return KM_ERROR_INVALID_INPUT_LENGTH;
}

TEE_Result run(rsa_operation_t& op, const direction& way, secret_bytes& output, uint32_t* length,
               keymaster_error_t* error) {
  if (!output.allocate(op.modulus_size())) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  if (way.limits_message) *error = check_message_fits(op);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  *length = output.size();
  const TEE_Result result =
      way.function(op.operation.get(), nullptr, 0, op.buffer.data(), op.buffered, output.data(), length);
  // No number below the modulus, or no such padding inside: the client's fault.
  if (result == TEE_ERROR_BAD_PARAMETERS) *error = KM_ERROR_INVALID_ARGUMENT;
  return result == TEE_ERROR_BAD_PARAMETERS ? TEE_SUCCESS : result;
}

TEE_Result finish(rsa_operation_t& op, const direction& way, secret_bytes& output, keymaster_error_t* error) {
  *error = KM_ERROR_OK;
  secret_bytes whole;
  uint32_t length = 0;
  const TEE_Result result = run(op, way, whole, &length, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) return result;
  if (way.always_right_aligns || op.padding == KM_PAD_NONE) {
    right_align(whole.span(), length);
  } else {
    whole.shorten(length);
  }
  output = std::move(whole);
  return TEE_SUCCESS;
}

rsa_operation_t& record(keymaster_operation_t* op) {
  return *static_cast<rsa_operation_t*>(op);
}

/// Takes an update whole or not at all. False, with nothing consumed: it is too long, which the caller traces.
bool update(rsa_operation_t& op, std::span<const uint8_t> input, uint32_t* input_consumed, uint32_t* total,
            keymaster_error_t* error) {
  *error = KM_ERROR_OK;
  if (gather_message(op, input, op.modulus_size(), total)) return true;
  *input_consumed = 0;
  *error = KM_ERROR_INVALID_INPUT_LENGTH;
  return false;
}

}  // namespace

keymaster_operation_t* create_rsa_encrypt(const operation_request& request, TEE_Result* result,
                                          keymaster_error_t* error) {
  return make_record<rsa_encrypt_operation_t>(
      {KM_PURPOSE_ENCRYPT, rsa_encrypt_free, rsa_encrypt_update, rsa_encrypt_finish}, result, error,
      [&](rsa_operation_t& op) { return prepare(op, request, encryption, error); });
}

keymaster_operation_t* create_rsa_decrypt(const operation_request& request, TEE_Result* result,
                                          keymaster_error_t* error) {
  return make_record<rsa_decrypt_operation_t>(
      {KM_PURPOSE_DECRYPT, rsa_decrypt_free, rsa_decrypt_update, rsa_decrypt_finish}, result, error,
      [&](rsa_operation_t& op) { return prepare(op, request, decryption, error); });
}

TEE_Result rsa_encrypt_update(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                              std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* /*output*/,
                              uint32_t* output_length, keymaster_error_t* error) {
  rsa_operation_t& encrypt = record(op);
  uint32_t total = 0;
  *output_length = 0;
  if (!update(encrypt, input, input_consumed, &total, error)) {
    TRACE_ERROR("Input too long to encrypt, key_size %d, input %dB", encrypt.key_size, total);
  }
  return TEE_SUCCESS;
}

TEE_Result rsa_decrypt_update(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                              std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* /*output*/,
                              uint32_t* output_length, keymaster_error_t* error) {
  rsa_operation_t& decrypt = record(op);
  uint32_t total = 0;
  *output_length = 0;
  if (!update(decrypt, input, input_consumed, &total, error)) {
    TRACE_ERROR("Input too long to decrypt, key_size %d, input %dB", decrypt.key_size, total);
  }
  return TEE_SUCCESS;
}

TEE_Result rsa_encrypt_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                              std::span<const uint8_t> /*input*/, secret_bytes& output, parameter_set& /*out_params*/,
                              keymaster_error_t* error) {
  const TEE_Result result = finish(record(op), encryption, output, error);
  if (result != TEE_SUCCESS) TRACE_ERROR("TEE_AsymmetricEncrypt failed with 0x%08x", result);
  return result;
}

TEE_Result rsa_decrypt_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                              std::span<const uint8_t> /*input*/, secret_bytes& output, parameter_set& /*out_params*/,
                              keymaster_error_t* error) {
  const TEE_Result result = finish(record(op), decryption, output, error);
  if (result != TEE_SUCCESS) TRACE_ERROR("TEE_AsymmetricDecrypt failed with 0x%08x", result);
  return result;
}

void rsa_encrypt_free(keymaster_operation_t* op) {
  auto* const encrypt = static_cast<rsa_encrypt_operation_t*>(op);
  if (encrypt == nullptr) {
    TRACE_ERROR("Try to free NULL rsa_encrypt_operation_t");
    return;
  }
  for (uint32_t n = missing_members(*encrypt); n > 0; --n) TRACE_ERROR("Try to free invalid rsa_encrypt_operation_t");
  delete_record(encrypt);
}

void rsa_decrypt_free(keymaster_operation_t* op) {
  auto* const decrypt = static_cast<rsa_decrypt_operation_t*>(op);
  if (decrypt == nullptr) {
    TRACE_ERROR("Try to free NULL rsa_decrypt_operation_t");
    return;
  }
  for (uint32_t n = missing_members(*decrypt); n > 0; --n) TRACE_ERROR("Try to free invalid rsa_decrypt_operation_t");
  delete_record(decrypt);
}

}  // namespace keymaster
