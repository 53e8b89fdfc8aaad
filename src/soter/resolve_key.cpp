#include "soter/resolve_key.h"

#include "algorithms/rsa/rsa_key_data.h"

namespace keymaster {

TEE_ObjectHandle resolve_key_from_data(std::span<const uint8_t> key_data, uint32_t* key_size_bits) {
  TEE_ObjectHandle key = TEE_HANDLE_NULL;
  keymaster_error_t error = KM_ERROR_OK;
  // The resolver has traced why there is none, and leaves null then.
  (void)rsa_resolve_key_data(key_data, &key, key_size_bits, &error);
  return key;
}

}  // namespace keymaster
