#include "algorithms/hmac/hmac_key.h"

#include <array>

#include "params/generated_key.h"
#include "params/key_tags.h"
#include "platform/cursor.h"
#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t header_size = 2 * sizeof(uint32_t);
constexpr uint32_t shortest = 64;  // bits, of keys and of MACs, whatever the digest

/// What a digest demands of its keys.
struct digest_rule {
  uint32_t digest;
  uint32_t object_type;
  uint32_t min_key_size;
  uint32_t max_key_size;
  uint32_t digest_size;  // bits; no MAC is longer
};

constexpr std::array<digest_rule, 6> rules = {{
    {KM_DIGEST_MD5, TEE_TYPE_HMAC_MD5, 64, 512, 128},
    {KM_DIGEST_SHA1, TEE_TYPE_HMAC_SHA1, 80, 512, 160},
    {KM_DIGEST_SHA_2_224, TEE_TYPE_HMAC_SHA224, 112, 512, 224},
    {KM_DIGEST_SHA_2_256, TEE_TYPE_HMAC_SHA256, 192, 1024, 256},
    {KM_DIGEST_SHA_2_384, TEE_TYPE_HMAC_SHA384, 256, 1024, 384},
    {KM_DIGEST_SHA_2_512, TEE_TYPE_HMAC_SHA512, 256, 1024, 512},
}};

keymaster_error_t check_general_key_size(uint64_t bits) {
  if (bits >= shortest && bits % 8 == 0) return KM_ERROR_OK;
  TRACE_ERROR("Invalid hmac key size %d", static_cast<uint32_t>(bits));
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

keymaster_error_t refuse_min_mac(uint32_t bits) {
  TRACE_ERROR("Invalid KM_TAG_MIN_MAC_LENGTH %d", bits);
  return KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH;
}

keymaster_error_t read_min_mac(const keymaster_key_param_set_t& params, uint32_t* bits) {
  const keymaster_key_param_t* const min_mac = key_param_set_get_unique(params, KM_TAG_MIN_MAC_LENGTH);
  if (min_mac == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_MIN_MAC_LENGTH or specified");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  *bits = min_mac->integer;
  return *bits >= shortest && *bits % 8 == 0 ? KM_ERROR_OK : refuse_min_mac(*bits);
}

keymaster_error_t find_rule(const keymaster_key_param_set_t& params, const digest_rule** rule) {
  const keymaster_key_param_t* const digest = key_param_set_get_unique(params, KM_TAG_DIGEST);
  if (digest == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_DIGEST");
    return KM_ERROR_UNSUPPORTED_DIGEST;
  }
  for (const digest_rule& candidate : rules) {
    if (candidate.digest != digest->enumerated) continue;
    *rule = &candidate;
    return KM_ERROR_OK;
  }
  return KM_ERROR_UNSUPPORTED_DIGEST;
}

/// What generation and import check alike once they know the size, in this order.
keymaster_error_t check_key(const keymaster_key_param_set_t& params, uint64_t bits, const digest_rule** rule) {
  uint32_t min_mac = 0;
  if (const keymaster_error_t e = check_general_key_size(bits); e != KM_ERROR_OK) return e;
  if (const keymaster_error_t e = read_min_mac(params, &min_mac); e != KM_ERROR_OK) return e;
  if (const keymaster_error_t e = find_rule(params, rule); e != KM_ERROR_OK) return e;
  if (bits < (*rule)->min_key_size || bits > (*rule)->max_key_size) {
    TRACE_ERROR("Invalid HMAC key size %d", static_cast<uint32_t>(bits));
    return KM_ERROR_UNSUPPORTED_KEY_SIZE;
  }
  return min_mac <= (*rule)->digest_size ? KM_ERROR_OK : refuse_min_mac(min_mac);
}

/// Lays out key data for a key of `bits`; `value` is where the key goes. False, with a trace line: no memory.
bool lay_out(uint32_t bits, uint32_t object_type, secret_bytes& key_data, std::span<uint8_t>& value) {
  if (!key_data.allocate(bits / 8 + header_size)) {
    TRACE_ERROR("Out of memory");
    return false;
  }
  byte_writer out{key_data.span()};
  return out.write_u32(bits) && out.write_u32(object_type) && out.reserve(bits / 8, value);
}

TEE_Result generate(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  uint32_t bits = 0;
  const digest_rule* rule = nullptr;
  *error = add_origin(params, KM_ORIGIN_GENERATED);
  if (*error == KM_ERROR_OK) *error = read_key_size(*params, &bits);
  if (*error == KM_ERROR_OK) *error = check_key(*params, bits, &rule);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;

  object_handle key;
  if (TEE_Result r = generate_object(rule->object_type, bits, {}, key); r != TEE_SUCCESS) return r;
  std::span<uint8_t> value;
  if (!lay_out(bits, rule->object_type, key_data, value)) {
    *error = KM_ERROR_UNKNOWN_ERROR;
    return TEE_SUCCESS;
  }
  return write_attribute(key, TEE_ATTR_SECRET_VALUE, value, error);
}

}  // namespace

TEE_Result hmac_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data, keymaster_error_t* error) {
  return generate_key_data(generate, params, key_data, error);
}

TEE_Result hmac_import_key(keymaster_key_param_set_t* params, std::span<const uint8_t> material, secret_bytes& key_data,
                           keymaster_error_t* error) {
  key_data.reset();
  const uint64_t bits = uint64_t{material.size()} * 8;
  const digest_rule* rule = nullptr;
  *error = add_origin(params, KM_ORIGIN_IMPORTED);
  if (*error == KM_ERROR_OK) *error = settle_key_size(params, bits);
  if (*error == KM_ERROR_OK) *error = check_key(*params, bits, &rule);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  std::span<uint8_t> value;
  if (!lay_out(static_cast<uint32_t>(bits), rule->object_type, key_data, value)) {
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  std::memcpy(value.data(), material.data(), material.size());
  return TEE_SUCCESS;
}

TEE_Result hmac_export_key(std::span<const uint8_t> /*key_data*/, uint8_t* /*output*/, uint32_t* output_length,
                           keymaster_error_t* error) {
  *output_length = 0;
  *error = KM_ERROR_UNSUPPORTED_KEY_FORMAT;
  return TEE_SUCCESS;
}

TEE_Result hmac_resolve_key_data(std::span<const uint8_t> key_data, TEE_ObjectHandle* key, uint32_t* object_type,
                                 uint32_t* key_size_bits, keymaster_error_t* error) {
  *key = TEE_HANDLE_NULL;
  byte_reader in{key_data};
  uint32_t bits = 0;
  std::span<const uint8_t> value;
  if (!in.read_u32(bits) || !in.read_u32(*object_type) || !in.read_bytes(bits / 8, value)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  object_handle object;
  if (TEE_Result r = make_secret_object(*object_type, bits, value, object); r != TEE_SUCCESS) return r;
  *key = object.release();
  if (key_size_bits != nullptr) *key_size_bits = bits;
  *error = KM_ERROR_OK;
  return TEE_SUCCESS;
}

}  // namespace keymaster
