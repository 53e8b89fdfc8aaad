#include "algorithms/ec/ec_operation.h"

#include <algorithm>
#include <array>
#include <cstring>

#include "algorithms/ec/ec_key_data.h"
#include "algorithms/ec/ec_signature_der.h"
#include "params/operation_record.h"
#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t longest_digest = 64;

/// The platform's digest by KM_TAG_DIGEST; 0: none to compute, or (MD5) none that ECDSA takes.
constexpr std::array<uint32_t, 7> digest_algorithms = {
    0, 0, TEE_ALG_SHA1, TEE_ALG_SHA224, TEE_ALG_SHA256, TEE_ALG_SHA384, TEE_ALG_SHA512};

ec_operation_t& record(keymaster_operation_t* op) {
  return *static_cast<ec_operation_t*>(op);
}

TEE_Result prepare_digest(ec_operation_t& op, const keymaster_key_param_set_t& in_params, keymaster_error_t* error) {
  const keymaster_key_param_t* const digest = key_param_set_get_unique(in_params, KM_TAG_DIGEST);
  if (digest == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_DIGEST");
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  if (digest->enumerated == KM_DIGEST_NONE) return TEE_SUCCESS;
  if (digest->enumerated == KM_DIGEST_MD5) *error = KM_ERROR_INCOMPATIBLE_DIGEST;
  if (digest->enumerated >= digest_algorithms.size()) *error = KM_ERROR_UNSUPPORTED_DIGEST;
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  op.uses_digest = true;
  return make_digest_operation(digest_algorithms[digest->enumerated], op.digest_operation);
}

TEE_Result prepare(ec_operation_t& op, const operation_request& request, uint32_t mode, keymaster_error_t* error) {
  const TEE_Result resolved = resolve_into(op.key, error, [&](TEE_ObjectHandle* key) {
    return ec_resolve_key_data(request.key_data, key, &op.key_size, error);
  });
  if (resolved != TEE_SUCCESS || *error != KM_ERROR_OK) return resolved;
  const ec_curve* const curve = find_ec_curve(op.key_size);
  if (curve == nullptr) {
    TRACE_ERROR("Unsupported key size %d", op.key_size);
    *error = KM_ERROR_UNSUPPORTED_KEY_SIZE;
    return TEE_SUCCESS;
  }
  if (TEE_Result r = prepare_digest(op, request.in_params, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  // A digest may be longer than the curve is wide; it is cut at finish.
  if (!op.digest.allocate(std::max(op.field_size(), longest_digest))) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  return make_operation(curve->algorithm, mode, op.key_size, op.key, op.operation);
}

/// Cuts the digest to the leftmost key-size bits, as ECDSA has it (FIPS 186-4, section 6.4). Where the key size is no
/// whole number of bytes, the bits are the low ones of the bytes that remain.
void truncate_digest(ec_operation_t& op) {
  if (uint64_t{op.digest_length} * 8 <= op.key_size) return;
  op.digest_length = op.field_size();
  const uint32_t surplus = op.digest_length * 8 - op.key_size;
  if (surplus == 0) return;
  uint8_t* const digest = op.digest.data();
  for (uint32_t i = op.digest_length; i > 0; --i) {
    const uint32_t above = i > 1 ? digest[i - 2] : 0;
    digest[i - 1] = static_cast<uint8_t>(((above << 8) | digest[i - 1]) >> surplus);
  }
}

TEE_Result finish_digest(ec_operation_t& op) {
  if (op.uses_digest) {
    op.digest_length = op.digest.size();
    if (TEE_Result r = TEE_DigestDoFinal(op.digest_operation.get(), nullptr, 0, op.digest.data(), &op.digest_length);
        r != TEE_SUCCESS) {
      TRACE_ERROR("DigestDoFinal failed with 0x%08x\n", r);
      return r;
    }
  }
  truncate_digest(op);
  return TEE_SUCCESS;
}

bool allocate_raw_signature(const ec_operation_t& op, secret_bytes& raw, keymaster_error_t* error) {
  if (raw.allocate(2 * op.field_size())) return true;
  TRACE_ERROR("Out of memory");
  *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  return false;
}

}  // namespace

keymaster_operation_t* create_ec_sign(const operation_request& request, TEE_Result* result, keymaster_error_t* error) {
  return make_record<ec_sign_operation_t>(
      {KM_PURPOSE_SIGN, ec_sign_free, ec_update, ec_sign_finish}, result, error,
      [&](ec_operation_t& op) { return prepare(op, request, TEE_MODE_SIGN, error); });
}

keymaster_operation_t* create_ec_verify(const operation_request& request, TEE_Result* result,
                                        keymaster_error_t* error) {
  return make_record<ec_verify_operation_t>(
      {KM_PURPOSE_VERIFY, ec_verify_free, ec_update, ec_verify_finish}, result, error,
      [&](ec_operation_t& op) { return prepare(op, request, TEE_MODE_VERIFY, error); });
}

TEE_Result ec_update(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                     std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* /*output*/,
                     uint32_t* output_length, keymaster_error_t* error) {
  ec_operation_t& ec = record(op);
  *output_length = 0;
  *error = KM_ERROR_OK;
  if (ec.uses_digest) {
    TEE_DigestUpdate(ec.digest_operation.get(), input.data(), static_cast<uint32_t>(input.size()));
    return TEE_SUCCESS;
  }
  const std::size_t room = ec.field_size() - ec.digest_length;
  const std::span<const uint8_t> taken = input.first(std::min(input.size(), room));
  if (!taken.empty()) std::memcpy(ec.digest.data() + ec.digest_length, taken.data(), taken.size());
  ec.digest_length += static_cast<uint32_t>(taken.size());
  *input_consumed = static_cast<uint32_t>(taken.size());
  return TEE_SUCCESS;
}

TEE_Result ec_sign_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                          std::span<const uint8_t> /*input*/, secret_bytes& output, parameter_set& /*out_params*/,
                          keymaster_error_t* error) {
  ec_operation_t& ec = record(op);
  *error = KM_ERROR_OK;
  if (TEE_Result r = finish_digest(ec); r != TEE_SUCCESS) return r;
  secret_bytes raw;
  if (!allocate_raw_signature(ec, raw, error)) return TEE_SUCCESS;
  uint32_t length = raw.size();
  if (TEE_Result r = TEE_AsymmetricSignDigest(ec.operation.get(), nullptr, 0, ec.digest.data(), ec.digest_length,
                                              raw.data(), &length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("AsymmetricSignDigest failed with 0x%08x\n", r);
    return r;
  }
  if (length == 0 || length > raw.size() || length % 2 != 0) {  // no two halves that can have been written
    *error = KM_ERROR_UNKNOWN_ERROR;
    return TEE_SUCCESS;
  }
  const std::span<const uint8_t> halves = raw.span().first(length);
  heap_bytes encoded;
  if (!der_encode_ec_signature(halves.first(halves.size() / 2), halves.subspan(halves.size() / 2), encoded)) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  const uint32_t size = encoded.size();
  output.adopt(encoded.release(), size);
  return TEE_SUCCESS;
}

TEE_Result ec_verify_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                            std::span<const uint8_t> input, secret_bytes& /*output*/, parameter_set& /*out_params*/,
                            keymaster_error_t* error) {
  ec_operation_t& ec = record(op);
  *error = KM_ERROR_OK;
  if (TEE_Result r = finish_digest(ec); r != TEE_SUCCESS) return r;
  secret_bytes raw;
  heap_bytes der;  // read twice: decoded, then compared
  if (!allocate_raw_signature(ec, raw, error)) return TEE_SUCCESS;
  if (!der.copy_of(input)) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  const std::span<uint8_t> r_half = raw.span().first(ec.field_size());
  const std::span<uint8_t> s_half = raw.span().subspan(ec.field_size());
  if (TEE_Result r = der_decode_ec_signature(der.span(), r_half, s_half); r != TEE_SUCCESS) {
    TRACE_ERROR("Decode signature failed, 0x%08x", r);
    *error = KM_ERROR_VERIFICATION_FAILED;
    return TEE_SUCCESS;
  }
  const TEE_Result result = TEE_AsymmetricVerifyDigest(ec.operation.get(), nullptr, 0, ec.digest.data(),
                                                       ec.digest_length, raw.data(), raw.size());
  if (result == TEE_SUCCESS) return TEE_SUCCESS;
  if (result != TEE_ERROR_SIGNATURE_INVALID) TRACE_ERROR("TEE_AsymmetricVerifyDigest return 0x%08x", result);
  *error = KM_ERROR_VERIFICATION_FAILED;
  return TEE_SUCCESS;
}

void ec_sign_free(keymaster_operation_t* op) {
  auto* const sign = static_cast<ec_sign_operation_t*>(op);
  if (sign == nullptr) {
    TRACE_ERROR("Try to free NULL ec_sign_operation_t");
    return;
  }
  for (uint32_t n = missing_handles(*sign); n > 0; --n) TRACE_ERROR("Try to free invalid ec_sign_operation_t");
  delete_record(sign);
}

void ec_verify_free(keymaster_operation_t* op) {
  auto* const verify = static_cast<ec_verify_operation_t*>(op);
  if (verify == nullptr) {
    TRACE_ERROR("Try to free NULL ec_verify_operation_t");
    return;
  }
  for (uint32_t n = missing_handles(*verify); n > 0; --n) TRACE_ERROR("Try to free invalid ec_verify_operation_t");
  delete_record(verify);
}

}  // namespace keymaster
