#include "algorithms/aes/aes_key.h"

#include "params/generated_key.h"
#include "params/key_tags.h"
#include "platform/cursor.h"
#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t header_size = sizeof(uint32_t);

keymaster_error_t check_aes_key_size(uint64_t bits) {
  if (bits == 128 || bits == 192 || bits == 256) return KM_ERROR_OK;
  TRACE_ERROR("Invalid AES key size %d", static_cast<uint32_t>(bits));
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

keymaster_error_t check_min_mac_length(const keymaster_key_param_set_t& params) {
  constexpr uint32_t shortest_tag = 96, longest_tag = 128;
  const keymaster_key_param_t* const min_mac = key_param_set_get_unique(params, KM_TAG_MIN_MAC_LENGTH);
  if (min_mac == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_MIN_MAC_LENGTH");
    return KM_ERROR_MISSING_MIN_MAC_LENGTH;
  }
  const uint32_t bits = min_mac->integer;
  if (bits >= shortest_tag && bits <= longest_tag && bits % 8 == 0) return KM_ERROR_OK;
  TRACE_ERROR("Invalid KM_TAG_MIN_MAC_LENGTH %d", bits);
  return KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH;
}

/// GCM needs a shortest tag; a key that names no block mode might become a GCM key.
keymaster_error_t check_block_modes(const keymaster_key_param_set_t& params) {
  if (!key_param_set_contains(params, KM_TAG_BLOCK_MODE)) return check_min_mac_length(params);
  for (const keymaster_key_param_t* mode = nullptr;
       (mode = key_param_set_find_next(params, KM_TAG_BLOCK_MODE, mode)) != nullptr;) {
    if (mode->enumerated != KM_MODE_GCM) continue;
    if (const keymaster_error_t e = check_min_mac_length(params); e != KM_ERROR_OK) return e;
  }
  return KM_ERROR_OK;
}

TEE_Result write_generated(const object_handle& key, uint32_t bits, secret_bytes& key_data, keymaster_error_t* error) {
  if (!key_data.allocate(bits / 8 + header_size)) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  byte_writer out{key_data.span()};
  std::span<uint8_t> value;
  if (!out.write_u32(bits) || !out.reserve(bits / 8, value)) return TEE_ERROR_GENERIC;
  return write_attribute(key, TEE_ATTR_SECRET_VALUE, value, error);
}

TEE_Result generate(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  uint32_t bits = 0;
  *error = add_origin(params, KM_ORIGIN_GENERATED);
  if (*error == KM_ERROR_OK) *error = read_key_size(*params, &bits);
  if (*error == KM_ERROR_OK) *error = check_aes_key_size(bits);
  if (*error == KM_ERROR_OK) *error = check_block_modes(*params);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  object_handle key;
  if (TEE_Result r = generate_object(TEE_TYPE_AES, bits, {}, key); r != TEE_SUCCESS) return r;
  return write_generated(key, bits, key_data, error);
}

}  // namespace

TEE_Result aes_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  return generate_key_data(generate, params, key_data, error);
}

TEE_Result aes_import_key(keymaster_key_param_set_t* params, std::span<const uint8_t> material, secret_bytes& key_data,
                          keymaster_error_t* error) {
  key_data.reset();
  const uint64_t bits = uint64_t{material.size()} * 8;
  *error = add_origin(params, KM_ORIGIN_IMPORTED);
  if (*error == KM_ERROR_OK) *error = settle_key_size(params, bits);
  if (*error == KM_ERROR_OK) *error = check_aes_key_size(bits);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  const uint32_t size = static_cast<uint32_t>(material.size());
  if (!key_data.allocate(size + header_size)) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  byte_writer out{key_data.span()};
  return out.write_u32(size * 8) && out.write_bytes(material.data(), size) ? TEE_SUCCESS : TEE_ERROR_GENERIC;
}

TEE_Result aes_export_key(std::span<const uint8_t> /*key_data*/, uint8_t* /*output*/, uint32_t* output_length,
                          keymaster_error_t* error) {
  *output_length = 0;
  *error = KM_ERROR_UNSUPPORTED_KEY_FORMAT;
  return TEE_SUCCESS;
}

TEE_Result aes_resolve_key_data(std::span<const uint8_t> key_data, TEE_ObjectHandle* key, uint32_t* key_size_bits,
                                keymaster_error_t* error) {
  *key = TEE_HANDLE_NULL;
  if (key_size_bits != nullptr) *key_size_bits = 0;
  byte_reader in{key_data};
  uint32_t bits = 0;
  std::span<const uint8_t> value;
  if (!in.read_u32(bits) || !in.read_bytes(bits / 8, value)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  object_handle object;
  if (TEE_Result r = make_secret_object(TEE_TYPE_AES, bits, value, object); r != TEE_SUCCESS) return r;
  *key = object.release();
  if (key_size_bits != nullptr) *key_size_bits = bits;
  *error = KM_ERROR_OK;
  return TEE_SUCCESS;
}

}  // namespace keymaster
