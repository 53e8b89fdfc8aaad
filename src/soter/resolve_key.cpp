#include "soter/resolve_key.h"

#include "algorithms/rsa/rsa_key_data.h"
#include "keystore/key_blob.h"
#include "platform/handles.h"

namespace keymaster {
namespace {

/// Platforms differ in what they do with a number of no digits.
bool has_public_half(std::span<const uint8_t> key_data) {
  byte_reader in{key_data};
  uint32_t key_size = 0;
  std::span<const uint8_t> n, e;
  const bool read = in.read_u32(key_size) && in.read_block(n) && in.read_block(e);
  return !read || (!n.empty() && !e.empty());  // key data that is cut short is the resolver's to refuse
}

}  // namespace

TEE_ObjectHandle resolve_key_from_data(std::span<const uint8_t> key_data, uint32_t* key_size_bits) {
  *key_size_bits = 0;
  if (!has_public_half(key_data)) return TEE_HANDLE_NULL;
  TEE_ObjectHandle resolved = TEE_HANDLE_NULL;
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = rsa_resolve_key_data(key_data, &resolved, key_size_bits, &error);
  object_handle key{resolved};
  if (result == TEE_SUCCESS && error == KM_ERROR_OK) return key.release();
  *key_size_bits = 0;
  return TEE_HANDLE_NULL;
}

TEE_ObjectHandle retrieve_key_from_pobj(std::span<const uint8_t> blob, uint32_t* key_size_bits) {
  *key_size_bits = 0;
  secret_bytes key_data;
  parameter_set characteristics;
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = open_key(blob, key_data, characteristics, &error);
  if (result != TEE_SUCCESS || error != KM_ERROR_OK) return TEE_HANDLE_NULL;
  // Key data of other algorithms may read as an RSA key's: 32 zero bytes, for one.
  const keymaster_key_param_t* const algorithm = key_param_set_get_unique(characteristics, KM_TAG_ALGORITHM);
  if (algorithm == nullptr || algorithm->enumerated != KM_ALGORITHM_RSA) return TEE_HANDLE_NULL;
  return resolve_key_from_data(key_data.span(), key_size_bits);
}

}  // namespace keymaster
