#include <cstring>

#include "algorithms/rsa/rsa_key.h"
#include "algorithms/rsa/rsa_key_data.h"
#include "params/key_tags.h"
#include "platform/byte_order.h"
#include "platform/cursor.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

/// Compares the exponent with the one that the client states, in the last bytes of its 8-byte form, or states it for
/// the client.
keymaster_error_t settle_exponent(keymaster_key_param_set_t* params, std::span<const uint8_t> field) {
  uint8_t big_endian[sizeof(uint64_t)] = {};
  if (field.size() > sizeof big_endian) {
    TRACE_ERROR("Public exponent mismatch");
    return KM_ERROR_IMPORT_PARAMETER_MISMATCH;
  }
  uint8_t* const low_bytes = big_endian + (sizeof big_endian - field.size());
  const keymaster_key_param_t* const given = key_param_set_get_unique(*params, KM_TAG_RSA_PUBLIC_EXPONENT);
  if (given == nullptr) {
    if (!field.empty()) std::memcpy(low_bytes, field.data(), field.size());
    return add_param(params, long_param(KM_TAG_RSA_PUBLIC_EXPONENT, swap_u64(load_u64(big_endian))));
  }
  const uint64_t swapped = swap_u64(given->long_integer);
  std::memcpy(big_endian, &swapped, sizeof swapped);
  if (!field.empty() && std::memcmp(low_bytes, field.data(), field.size()) != 0) {
    TRACE_ERROR("Public exponent mismatch");
    return KM_ERROR_IMPORT_PARAMETER_MISMATCH;
  }
  return KM_ERROR_OK;
}

keymaster_error_t store(std::span<const uint8_t> parsed, uint32_t key_size, secret_bytes& key_data) {
  const uint64_t total = sizeof(uint32_t) + uint64_t{parsed.size()};
  if (total > UINT32_MAX || !key_data.allocate(static_cast<uint32_t>(total))) {
    TRACE_ERROR("Out of memory");
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  byte_writer out{key_data.span()};
  if (out.write_u32(key_size) && out.write_bytes(parsed.data(), static_cast<uint32_t>(parsed.size()))) {
    return KM_ERROR_OK;
  }
  return KM_ERROR_UNKNOWN_ERROR;
}

}  // namespace

TEE_Result rsa_import_key(keymaster_key_param_set_t* params, std::span<const uint8_t> material, secret_bytes& key_data,
                          keymaster_error_t* error) {
  key_data.reset();
  *error = KM_ERROR_OK;
  byte_reader in{material};
  rsa_components components;
  if (!read_rsa_components(in, components)) return TEE_ERROR_GENERIC;

  // Every byte of the field counts: a modulus with a leading zero is taken 8 bits larger.
  const uint64_t key_size = uint64_t{components[rsa_modulus].size()} * 8;
  *error = add_origin(params, KM_ORIGIN_IMPORTED);
  if (*error == KM_ERROR_OK) *error = settle_key_size(params, key_size);
  if (*error == KM_ERROR_OK) *error = check_rsa_key_size(key_size);
  if (*error == KM_ERROR_OK) *error = settle_exponent(params, components[rsa_public_exponent]);
  if (*error == KM_ERROR_OK) {
    const std::span<const uint8_t> parsed = material.first(material.size() - in.remaining());
    *error = store(parsed, static_cast<uint32_t>(key_size), key_data);
  }
  if (*error != KM_ERROR_OK) key_data.reset();
  return TEE_SUCCESS;
}

}  // namespace keymaster
