#include "algorithms/hmac/hmac_operation.h"

#include <algorithm>
#include <array>

#include "algorithms/hmac/hmac_key.h"
#include "params/operation_record.h"
#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t longest_mac = 64;  // bytes, of HMAC-SHA-512

struct type_row {
  uint32_t object_type;
  uint32_t algorithm;
};

constexpr std::array<type_row, 6> types = {{
    {TEE_TYPE_HMAC_MD5, TEE_ALG_HMAC_MD5},
    {TEE_TYPE_HMAC_SHA1, TEE_ALG_HMAC_SHA1},
    {TEE_TYPE_HMAC_SHA224, TEE_ALG_HMAC_SHA224},
    {TEE_TYPE_HMAC_SHA256, TEE_ALG_HMAC_SHA256},
    {TEE_TYPE_HMAC_SHA384, TEE_ALG_HMAC_SHA384},
    {TEE_TYPE_HMAC_SHA512, TEE_ALG_HMAC_SHA512},
}};

hmac_operation_t& record(keymaster_operation_t* op) {
  return *static_cast<hmac_operation_t*>(op);
}

TEE_Result start_mac(hmac_operation_t& op, uint32_t object_type, keymaster_error_t* error) {
  const auto row = std::find_if(types.begin(), types.end(),
                                [object_type](const type_row& r) { return r.object_type == object_type; });
  if (row == types.end()) {
    TRACE_ERROR("Unsupported key type");
    *error = KM_ERROR_INVALID_KEY_BLOB;
    return TEE_SUCCESS;
  }
  if (TEE_Result r = make_operation(row->algorithm, TEE_MODE_MAC, op.key_size, op.key, op.operation);
      r != TEE_SUCCESS) {
    return r;
  }
  TEE_MACInit(op.operation.get(), nullptr, 0);
  return TEE_SUCCESS;
}

TEE_Result prepare(hmac_operation_t& op, const operation_request& request, keymaster_error_t* error) {
  uint32_t object_type = 0;
  const TEE_Result resolved = resolve_into(op.key, error, [&](TEE_ObjectHandle* key) {
    return hmac_resolve_key_data(request.key_data, key, &object_type, &op.key_size, error);
  });
  if (resolved != TEE_SUCCESS || *error != KM_ERROR_OK) return resolved;
  const keymaster_key_param_t* const mac_length = key_param_set_get_unique(request.in_params, KM_TAG_MAC_LENGTH);
  if (mac_length == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_MAC_LENGTH");
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  op.mac_length = mac_length->integer;
  return start_mac(op, object_type, error);
}

/// Computes the MAC and keeps as many of its bytes as the client wants.
TEE_Result compute(hmac_operation_t& op, secret_bytes& wanted, keymaster_error_t* error) {
  if (!wanted.allocate(op.mac_size())) {
    TRACE_ERROR("Out of memory, need %dB", op.mac_size());
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  wiped_array<longest_mac> mac;
  uint32_t length = longest_mac;
  if (TEE_Result r = TEE_MACComputeFinal(op.operation.get(), nullptr, 0, mac.bytes, &length); r != TEE_SUCCESS) {
    TRACE_ERROR("MACComputeFinal failed with 0x%08x\n", r);
    return r;
  }
  length = std::min(length, longest_mac);  // what there is room for, whatever the platform claims
  if (length < wanted.size()) {
    TRACE_ERROR("Too short output of HMAC operation, expect at least %dB, got %dB", wanted.size(), length);
    *error = KM_ERROR_UNKNOWN_ERROR;
    return TEE_SUCCESS;
  }
  std::copy_n(mac.bytes, wanted.size(), wanted.data());
  return TEE_SUCCESS;
}

}  // namespace

keymaster_operation_t* create_hmac_sign(const operation_request& request, TEE_Result* result,
                                        keymaster_error_t* error) {
  return make_record<hmac_sign_operation_t>({KM_PURPOSE_SIGN, hmac_sign_free, hmac_update, hmac_sign_finish}, result,
                                            error, [&](hmac_operation_t& op) { return prepare(op, request, error); });
}

keymaster_operation_t* create_hmac_verify(const operation_request& request, TEE_Result* result,
                                          keymaster_error_t* error) {
  return make_record<hmac_verify_operation_t>({KM_PURPOSE_VERIFY, hmac_verify_free, hmac_update, hmac_verify_finish},
                                              result, error,
                                              [&](hmac_operation_t& op) { return prepare(op, request, error); });
}

TEE_Result hmac_update(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                       std::span<const uint8_t> input, uint32_t* /*input_consumed*/, uint8_t* /*output*/,
                       uint32_t* output_length, keymaster_error_t* error) {
  TEE_MACUpdate(record(op).operation.get(), input.data(), static_cast<uint32_t>(input.size()));
  *output_length = 0;
  *error = KM_ERROR_OK;
  return TEE_SUCCESS;
}

TEE_Result hmac_sign_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                            std::span<const uint8_t> /*input*/, secret_bytes& output, parameter_set& /*out_params*/,
                            keymaster_error_t* error) {
  *error = KM_ERROR_OK;
  const TEE_Result result = compute(record(op), output, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) output.reset();
  return result;
}

TEE_Result hmac_verify_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& /*in_params*/,
                              std::span<const uint8_t> input, secret_bytes& /*output*/, parameter_set& /*out_params*/,
                              keymaster_error_t* error) {
  *error = KM_ERROR_OK;
  secret_bytes expected;
  if (TEE_Result r = compute(record(op), expected, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  if (input.size() < expected.size() || !constant_time_equal(expected.span(), input.first(expected.size()))) {
    TRACE_ERROR("Signature mismatch");
    *error = KM_ERROR_VERIFICATION_FAILED;
  }
  return TEE_SUCCESS;
}

void hmac_sign_free(keymaster_operation_t* op) {
  auto* const sign = static_cast<hmac_sign_operation_t*>(op);
  if (sign == nullptr) {
    TRACE_ERROR("Try to free NULL hmac_sign_operation_t");
    return;
  }
  for (uint32_t n = missing_handles(*sign); n > 0; --n) TRACE_ERROR("Try to free invalid hmac_sign_operation_t");
  delete_record(sign);
}

void hmac_verify_free(keymaster_operation_t* op) {
  auto* const verify = static_cast<hmac_verify_operation_t*>(op);
  if (verify == nullptr) {
    TRACE_ERROR("Try to free NULL hmac_verify_operation_t");
    return;
  }
  for (uint32_t n = missing_handles(*verify); n > 0; --n) TRACE_ERROR("Try to free invalid hmac_verify_operation_t");
  delete_record(verify);
}

}  // namespace keymaster
