#include "algorithms/rsa/rsa_key.h"
#include "algorithms/rsa/rsa_key_data.h"
#include "params/generated_key.h"
#include "params/key_tags.h"
#include "platform/byte_order.h"
#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

using component_lengths = std::array<uint32_t, rsa_component_count>;

/// What a client must say of a key that is to be made.
struct generation_request {
  uint32_t key_size = 0;
  uint64_t exponent_big_endian = 0;  // 8 bytes as the attribute takes them, leading zeros included
};

keymaster_error_t read_request(keymaster_key_param_set_t* params, generation_request& request) {
  if (const keymaster_error_t e = add_origin(params, KM_ORIGIN_GENERATED); e != KM_ERROR_OK) return e;
  const keymaster_key_param_t* const exponent = key_param_set_get_unique(*params, KM_TAG_RSA_PUBLIC_EXPONENT);
  if (exponent == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_RSA_PUBLIC_EXPONENT specified");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  request.exponent_big_endian = swap_u64(exponent->long_integer);
  if (const keymaster_error_t e = read_key_size(*params, &request.key_size); e != KM_ERROR_OK) return e;
  return check_rsa_key_size(request.key_size);
}

TEE_Result make_object(const generation_request& request, object_handle& key) {
  TEE_Attribute exponent;
  TEE_InitRefAttribute(&exponent, TEE_ATTR_RSA_PUBLIC_EXPONENT, &request.exponent_big_endian,
                       sizeof request.exponent_big_endian);
  return generate_object(TEE_TYPE_RSA_KEYPAIR, request.key_size, {&exponent, 1}, key);
}

/// Learns the lengths of the components, which are as short as their values allow.
TEE_Result measure(const object_handle& key, uint32_t key_size, component_lengths& lengths, keymaster_error_t* error) {
  secret_bytes scratch;
  if (!scratch.allocate(key_size / 8)) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  const TEE_Result result = measure_attributes(key, rsa_component_attributes, scratch.span(), lengths);
  if (result != TEE_SUCCESS) TRACE_ERROR("GetObjectBufferAttribute failed with 0x%08x\n", result);
  return result;
}

TEE_Result generate(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  generation_request request;
  *error = read_request(params, request);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;

  object_handle key;
  if (TEE_Result r = make_object(request, key); r != TEE_SUCCESS) return r;
  component_lengths lengths = {};
  if (TEE_Result r = measure(key, request.key_size, lengths, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  const uint64_t total = measured_size(lengths);
  if (total > UINT32_MAX || !key_data.allocate(static_cast<uint32_t>(total))) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  return write_attributes(key, request.key_size, rsa_component_attributes, lengths, key_data, error);
}

}  // namespace

keymaster_error_t check_rsa_key_size(uint64_t key_size_bits) {
  constexpr uint64_t above_largest = 8193;
  if (key_size_bits % 8 == 0 && key_size_bits < above_largest) return KM_ERROR_OK;
  TRACE_ERROR("Invalid RSA key size %d", static_cast<uint32_t>(key_size_bits));
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

TEE_Result rsa_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  return generate_key_data(generate, params, key_data, error);
}

}  // namespace keymaster
