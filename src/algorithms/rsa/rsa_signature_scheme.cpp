#include "algorithms/rsa/rsa_signature_scheme.h"

#include <array>
#include <cstring>

#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

struct digest_row {
  uint32_t digest;
  uint32_t size;
  uint32_t digest_algorithm;
  uint32_t pkcs1_algorithm;
  uint32_t pss_algorithm;  // 0: PSS is not defined with it
};

/// One row a digest; a row's place is the digest's value.
constexpr std::array<digest_row, 7> digests = {{
    {KM_DIGEST_NONE, 0, 0, TEE_ALG_RSA_NOPAD, 0},
    {KM_DIGEST_MD5, 16, TEE_ALG_MD5, TEE_ALG_RSASSA_PKCS1_V1_5_MD5, 0},
    {KM_DIGEST_SHA1, 20, TEE_ALG_SHA1, TEE_ALG_RSASSA_PKCS1_V1_5_SHA1, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1},
    {KM_DIGEST_SHA_2_224, 28, TEE_ALG_SHA224, TEE_ALG_RSASSA_PKCS1_V1_5_SHA224, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA224},
    {KM_DIGEST_SHA_2_256, 32, TEE_ALG_SHA256, TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256},
    {KM_DIGEST_SHA_2_384, 48, TEE_ALG_SHA384, TEE_ALG_RSASSA_PKCS1_V1_5_SHA384, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA384},
    {KM_DIGEST_SHA_2_512, 64, TEE_ALG_SHA512, TEE_ALG_RSASSA_PKCS1_V1_5_SHA512, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA512},
}};
static_assert([] {
  for (uint32_t i = 0; i < digests.size(); ++i) {
    if (digests[i].digest != i) return false;
  }
  return true;
}());

constexpr uint32_t pkcs1_overhead = 11;
/// What PSS needs beside the digest, as this system counts it: the trailer byte, a flag bit and a salt of 20 bytes.
constexpr uint32_t pss_overhead = 22;

keymaster_error_t check_pss_fits(const rsa_operation_t& op) {
  if (op.padding != KM_PAD_RSA_PSS) return KM_ERROR_OK;
  const uint32_t needed = digest_size(op.digest) + pss_overhead;
  if (needed <= op.modulus_size()) return KM_ERROR_OK;
  TRACE_ERROR("Too short key to fit digest, flag and salt, key_size %d, need %d", op.key_size, needed * 8);
  return KM_ERROR_INCOMPATIBLE_DIGEST;
}

keymaster_error_t read_scheme_parameters(rsa_operation_t& op, const keymaster_key_param_set_t& in_params) {
  const keymaster_key_param_t* const padding = key_param_set_get_unique(in_params, KM_TAG_PADDING);
  if (padding == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_PADDING");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  const keymaster_key_param_t* const digest = key_param_set_get_unique(in_params, KM_TAG_DIGEST);
  if (digest == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_DIGEST");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  op.padding = padding->enumerated;
  op.digest = digest->enumerated;
  return KM_ERROR_OK;
}

/// With a digest the platform signs or verifies; without one it only does the bare private or public operation, which
/// it calls decryption and encryption.
uint32_t platform_mode(uint32_t purpose, bool with_digest) {
  if (purpose == KM_PURPOSE_SIGN) return with_digest ? TEE_MODE_SIGN : TEE_MODE_DECRYPT;
  return with_digest ? TEE_MODE_VERIFY : TEE_MODE_ENCRYPT;
}

}  // namespace

uint32_t digest_size(uint32_t digest) {
  return digest < digests.size() ? digests[digest].size : 0;
}

keymaster_error_t choose_signature_scheme(uint32_t padding, uint32_t digest, rsa_signature_scheme* scheme) {
  if (digest >= digests.size()) return KM_ERROR_UNSUPPORTED_DIGEST;
  const digest_row& row = digests[digest];
  uint32_t rsa_algorithm = 0;
  switch (padding) {
    case KM_PAD_RSA_PSS:
      rsa_algorithm = row.pss_algorithm;
      break;
    case KM_PAD_RSA_PKCS1_1_5_SIGN:
      rsa_algorithm = row.pkcs1_algorithm;
      break;
    case KM_PAD_NONE:
      rsa_algorithm = digest == KM_DIGEST_NONE ? TEE_ALG_RSA_NOPAD : 0;
      break;
    default:
      return KM_ERROR_UNSUPPORTED_PADDING_MODE;
  }
  if (rsa_algorithm == 0) return KM_ERROR_INCOMPATIBLE_DIGEST;
  *scheme = {rsa_algorithm, row.digest_algorithm};
  return KM_ERROR_OK;
}

TEE_Result prepare_signature_operation(rsa_operation_t& op, const operation_request& request,
                                       keymaster_error_t* error) {
  if (TEE_Result r = resolve_rsa_key(op, request.key_data, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  rsa_signature_scheme scheme;
  *error = read_scheme_parameters(op, request.in_params);
  if (*error == KM_ERROR_OK) *error = choose_signature_scheme(op.padding, op.digest, &scheme);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;

  const bool with_digest = scheme.digest_algorithm != 0;
  if (with_digest) {
    if (TEE_Result r = make_digest_operation(scheme.digest_algorithm, op.digest_operation); r != TEE_SUCCESS) return r;
  }
  *error = check_pss_fits(op);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  return set_rsa_operation(op, scheme.rsa_algorithm, platform_mode(op.purpose, with_digest));
}

int64_t raw_message_limit(const rsa_operation_t& op) {
  return int64_t{op.modulus_size()} - (op.padding == KM_PAD_RSA_PKCS1_1_5_SIGN ? pkcs1_overhead : 0);
}

bool update_signature_operation(rsa_operation_t& op, std::span<const uint8_t> input, uint32_t* total) {
  if (!op.digest_operation) return gather_message(op, input, raw_message_limit(op), total);
  TEE_DigestUpdate(op.digest_operation.get(), input.data(), static_cast<uint32_t>(input.size()));
  return true;
}

bool build_pkcs1_block(rsa_operation_t& op) {
  if (int64_t{op.buffered} > raw_message_limit(op)) return false;
  const std::span<uint8_t> block = op.buffer.span();
  const std::size_t separator = block.size() - op.buffered - 1;
  std::memmove(&block[separator] + 1, block.data(), op.buffered);
  std::memset(block.data(), 0xFF, separator);
  block[0] = 0x00;
  block[1] = 0x01;
  block[separator] = 0x00;
  return true;
}

TEE_Result finish_digest(rsa_operation_t& op, uint32_t* length) {
  *length = op.buffer.size();
  TEE_Result result = TEE_DigestDoFinal(op.digest_operation.get(), nullptr, 0, op.buffer.data(), length);
  if (result == TEE_SUCCESS && *length > op.buffer.size()) result = TEE_ERROR_GENERIC;  // it can't have fitted
  if (result != TEE_SUCCESS) TRACE_ERROR("DigestDoFinal failed with 0x%08x\n", result);
  return result;
}

}  // namespace keymaster
