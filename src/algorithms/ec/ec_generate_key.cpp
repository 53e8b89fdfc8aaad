#include <array>

#include "algorithms/ec/ec_key.h"
#include "algorithms/ec/ec_key_data.h"
#include "params/algorithm.h"
#include "params/key_tags.h"
#include "platform/handles.h"
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

TEE_Result generate(const ec_curve& curve, object_handle& key) {
  if (TEE_Result r = key.allocate(TEE_TYPE_ECDSA_KEYPAIR, curve.key_size); r != TEE_SUCCESS) {
    TRACE_ERROR("AllocateTransientObject failed with 0x%08x\n", r);
    return r;
  }
  TEE_Attribute attribute;
  TEE_InitValueAttribute(&attribute, TEE_ATTR_ECC_CURVE, curve.curve, 0);
  if (TEE_Result r = TEE_GenerateKey(key.get(), curve.key_size, &attribute, 1); r != TEE_SUCCESS) {
    TRACE_ERROR("GenerateKey failed with 0x%08x\n", r);
    return r;
  }
  return TEE_SUCCESS;
}

/// Learns the lengths of the values; `*memory_short` tells of a failure without a code. Nothing is traced of a failure.
TEE_Result measure(const object_handle& key, uint32_t key_size, value_lengths& lengths, bool* memory_short) {
  secret_bytes scratch;
  if (!scratch.allocate((key_size + 7) / 8)) {
    TRACE_ERROR("Out of memory");
    *memory_short = true;
    return TEE_SUCCESS;
  }
  for (std::size_t i = 0; i < stored_attributes.size(); ++i) {
    lengths[i] = key_size / 8;
    if (TEE_Result r = TEE_GetObjectBufferAttribute(key.get(), stored_attributes[i], scratch.data(), &lengths[i]);
        r != TEE_SUCCESS) {
      return r;
    }
  }
  return TEE_SUCCESS;
}

/// Generates until the values fit the capacity that is offered for them.
TEE_Result generate_measured(const ec_curve& curve, object_handle& key, value_lengths& lengths, bool* memory_short) {
  const uint32_t attempts = curve.key_size == wide_curve ? most_attempts : 1;
  TEE_Result result = TEE_ERROR_SHORT_BUFFER;
  for (uint32_t i = 0; i < attempts && result == TEE_ERROR_SHORT_BUFFER; ++i) {
    if (TEE_Result r = generate(curve, key); r != TEE_SUCCESS) return r;
    result = measure(key, curve.key_size, lengths, memory_short);
  }
  if (result != TEE_SUCCESS) TRACE_ERROR("GetObjectBufferAttribute failed with 0x%08x\n", result);
  return result;
}

TEE_Result write_value(const object_handle& key, uint32_t attribute, uint32_t measured, byte_writer& out,
                       keymaster_error_t* error) {
  std::span<uint8_t> place;
  if (!out.write_u32(measured) || !out.reserve(measured, place)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  uint32_t length = measured;
  if (TEE_Result r = TEE_GetObjectBufferAttribute(key.get(), attribute, place.data(), &length); r != TEE_SUCCESS) {
    TRACE_ERROR("GetObjectBufferAttribute failed with 0x%08x\n", r);
    return r;
  }
  if (length != measured) {
    TRACE_ERROR("Buffer size modified, before %dB, after %dB", measured, length);
    *error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

TEE_Result write_key_data(const object_handle& key, uint32_t key_size, const value_lengths& lengths,
                          secret_bytes& key_data, keymaster_error_t* error) {
  uint64_t total = sizeof(uint32_t);
  for (const uint32_t length : lengths) total += sizeof(uint32_t) + uint64_t{length};
  if (total > UINT32_MAX || !key_data.allocate(static_cast<uint32_t>(total))) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_UNKNOWN_ERROR;
    return TEE_SUCCESS;
  }
  byte_writer out{key_data.span()};
  if (!out.write_u32(key_size)) return TEE_ERROR_GENERIC;
  for (std::size_t i = 0; i < stored_attributes.size(); ++i) {
    if (TEE_Result r = write_value(key, stored_attributes[i], lengths[i], out, error);
        r != TEE_SUCCESS || *error != KM_ERROR_OK) {
      return r;
    }
  }
  return TEE_SUCCESS;
}

TEE_Result generate_key_data(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  uint32_t key_size = 0;
  *error = add_origin(params, KM_ORIGIN_GENERATED);
  if (*error == KM_ERROR_OK) *error = read_key_size(*params, &key_size);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  const ec_curve* const curve = find_ec_curve(key_size);
  if (curve == nullptr) {
    TRACE_ERROR("Invalid EC key size %d", key_size);
    *error = KM_ERROR_UNSUPPORTED_KEY_SIZE;
    return TEE_SUCCESS;
  }
  object_handle key;
  value_lengths lengths = {};
  bool memory_short = false;
  if (TEE_Result r = generate_measured(*curve, key, lengths, &memory_short); r != TEE_SUCCESS) return r;
  if (memory_short) {
    *error = KM_ERROR_UNKNOWN_ERROR;
    return TEE_SUCCESS;
  }
  return write_key_data(key, key_size, lengths, key_data, error);
}

}  // namespace

TEE_Result ec_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  key_data.reset();
  *error = KM_ERROR_OK;
  const TEE_Result result = generate_key_data(params, key_data, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) key_data.reset();
  return result;
}

}  // namespace keymaster
