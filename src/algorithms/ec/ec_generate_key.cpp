#include <array>

#include "algorithms/ec/ec_key.h"
#include "algorithms/ec/ec_key_data.h"
#include "params/generated_key.h"
#include "params/key_tags.h"
#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr std::array<uint32_t, 3> stored_attributes = {TEE_ATTR_ECC_PUBLIC_VALUE_X, TEE_ATTR_ECC_PUBLIC_VALUE_Y,
                                                       TEE_ATTR_ECC_PRIVATE_VALUE};
using value_lengths = std::array<uint32_t, stored_attributes.size()>;

/// Values of a P-521 key fill 65 bytes or 66, and this module offers 65: seven keys of eight don't fit and are thrown
/// away. 128 attempts fail once in 26 million.
constexpr uint32_t wide_curve = 521;
constexpr uint32_t most_attempts = 128;

TEE_Result make_object(const ec_curve& curve, object_handle& key) {
  TEE_Attribute attribute;
  TEE_InitValueAttribute(&attribute, TEE_ATTR_ECC_CURVE, curve.curve, 0);
  return generate_object(TEE_TYPE_ECDSA_KEYPAIR, curve.key_size, {&attribute, 1}, key);
}

/// Generates until the values fit the capacity that is offered for them, which is the whole bytes of the key size.
TEE_Result make_fitting_object(const ec_curve& curve, object_handle& key, value_lengths& lengths,
                               keymaster_error_t* error) {
  const uint32_t attempts = curve.key_size == wide_curve ? most_attempts : 1;
  secret_bytes scratch;
  TEE_Result result = TEE_ERROR_SHORT_BUFFER;
  for (uint32_t i = 0; i < attempts && result == TEE_ERROR_SHORT_BUFFER; ++i) {
    if (TEE_Result r = make_object(curve, key); r != TEE_SUCCESS) return r;
    if (!scratch && !scratch.allocate((curve.key_size + 7) / 8)) {
      TRACE_ERROR("Out of memory");
      *error = KM_ERROR_UNKNOWN_ERROR;
      return TEE_SUCCESS;
    }
    result = measure_attributes(key, stored_attributes, scratch.span().first(curve.key_size / 8), lengths);
  }
  if (result != TEE_SUCCESS) TRACE_ERROR("GetObjectBufferAttribute failed with 0x%08x\n", result);
  return result;
}

keymaster_error_t read_curve(keymaster_key_param_set_t* params, const ec_curve** curve) {
  uint32_t key_size = 0;
  if (const keymaster_error_t e = add_origin(params, KM_ORIGIN_GENERATED); e != KM_ERROR_OK) return e;
  if (const keymaster_error_t e = read_key_size(*params, &key_size); e != KM_ERROR_OK) return e;
  *curve = find_ec_curve(key_size);
  if (*curve != nullptr) return KM_ERROR_OK;
  TRACE_ERROR("Invalid EC key size %d", key_size);
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

TEE_Result generate(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  const ec_curve* curve = nullptr;
  *error = read_curve(params, &curve);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;

  object_handle key;
  value_lengths lengths = {};
  if (TEE_Result r = make_fitting_object(*curve, key, lengths, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  const uint64_t total = measured_size(lengths);
  if (total > UINT32_MAX || !key_data.allocate(static_cast<uint32_t>(total))) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_UNKNOWN_ERROR;
    return TEE_SUCCESS;
  }
  return write_attributes(key, curve->key_size, stored_attributes, lengths, key_data, error);
}

}  // namespace

TEE_Result ec_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  return generate_key_data(generate, params, key_data, error);
}

}  // namespace keymaster
