#include "algorithms/rsa/rsa_key.h"
#include "algorithms/rsa/rsa_key_data.h"
#include "params/key_tags.h"
#include "platform/byte_order.h"
#include "platform/cursor.h"
#include "platform/handles.h"
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

TEE_Result generate(const generation_request& request, object_handle& key) {
  if (TEE_Result r = key.allocate(TEE_TYPE_RSA_KEYPAIR, request.key_size); r != TEE_SUCCESS) {
    TRACE_ERROR("AllocateTransientObject failed with 0x%08x\n", r);
    return r;
  }
  TEE_Attribute exponent;
  TEE_InitRefAttribute(&exponent, TEE_ATTR_RSA_PUBLIC_EXPONENT, &request.exponent_big_endian,
                       sizeof request.exponent_big_endian);
  if (TEE_Result r = TEE_GenerateKey(key.get(), request.key_size, &exponent, 1); r != TEE_SUCCESS) {
    TRACE_ERROR("GenerateKey failed with 0x%08x\n", r);
    return r;
  }
  return TEE_SUCCESS;
}

/// Reads one component into `place`; `*length` is what the platform says of it.
TEE_Result read_component(const object_handle& key, uint32_t component, std::span<uint8_t> place, uint32_t* length) {
  *length = static_cast<uint32_t>(place.size());
  const TEE_Result result =
      TEE_GetObjectBufferAttribute(key.get(), rsa_component_attributes[component], place.data(), length);
  if (result != TEE_SUCCESS) TRACE_ERROR("GetObjectBufferAttribute failed with 0x%08x\n", result);
  return result;
}

/// Learns the lengths of the components, which are as short as their values allow.
TEE_Result measure(const object_handle& key, uint32_t key_size, component_lengths& lengths, uint64_t* total,
                   keymaster_error_t* error) {
  secret_bytes scratch;
  if (!scratch.allocate(key_size / 8)) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  *total = sizeof(uint32_t);
  for (uint32_t i = 0; i < rsa_component_count; ++i) {
    if (TEE_Result r = read_component(key, i, scratch.span(), &lengths[i]); r != TEE_SUCCESS) return r;
    *total += sizeof(uint32_t) + uint64_t{lengths[i]};
  }
  return TEE_SUCCESS;
}

/// Writes the key data; every component goes straight to its place.
TEE_Result write_key_data(const object_handle& key, uint32_t key_size, const component_lengths& lengths,
                          secret_bytes& key_data, keymaster_error_t* error) {
  byte_writer out{key_data.span()};
  bool fits = out.write_u32(key_size);
  for (uint32_t i = 0; i < rsa_component_count; ++i) {
    std::span<uint8_t> place;
    fits = fits && out.write_u32(lengths[i]) && out.reserve(lengths[i], place);
    if (!fits) {
      TRACE_ERROR("Too short input");
      return TEE_ERROR_GENERIC;
    }
    uint32_t length = 0;
    if (TEE_Result r = read_component(key, i, place, &length); r != TEE_SUCCESS) return r;
    if (length != lengths[i]) {
      TRACE_ERROR("Buffer size modified, before %dB, after %dB", lengths[i], length);
      *error = KM_ERROR_UNKNOWN_ERROR;
      return TEE_SUCCESS;
    }
  }
  return TEE_SUCCESS;
}

TEE_Result generate_key_data(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  generation_request request;
  *error = read_request(params, request);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;

  object_handle key;
  if (TEE_Result r = generate(request, key); r != TEE_SUCCESS) return r;
  component_lengths lengths = {};
  uint64_t total = 0;
  if (TEE_Result r = measure(key, request.key_size, lengths, &total, error);
      r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  if (total > UINT32_MAX || !key_data.allocate(static_cast<uint32_t>(total))) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  return write_key_data(key, request.key_size, lengths, key_data, error);
}

}  // namespace

keymaster_error_t check_rsa_key_size(uint64_t key_size_bits) {
  constexpr uint64_t above_largest = 8193;
  if (key_size_bits % 8 == 0 && key_size_bits < above_largest) return KM_ERROR_OK;
  TRACE_ERROR("Invalid RSA key size %d", static_cast<uint32_t>(key_size_bits));
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

TEE_Result rsa_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  key_data.reset();
  *error = KM_ERROR_OK;
  const TEE_Result result = generate_key_data(params, key_data, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) key_data.reset();
  return result;
}

}  // namespace keymaster
