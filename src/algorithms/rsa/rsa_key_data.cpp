#include "algorithms/rsa/rsa_key_data.h"

#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {

bool read_rsa_components(byte_reader& in, rsa_components& components) {
  for (std::span<const uint8_t>& component : components) {
    if (!in.read_block(component)) {
      TRACE_ERROR("Too short input");
      return false;
    }
  }
  return true;
}

TEE_Result rsa_resolve_key_data(std::span<const uint8_t> key_data, TEE_ObjectHandle* key, uint32_t* key_size_bits,
                                keymaster_error_t* error) {
  *key = TEE_HANDLE_NULL;
  *error = KM_ERROR_OK;
  byte_reader in{key_data};
  uint32_t key_size = 0;
  if (!in.read_u32(key_size)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  rsa_components components;
  if (!read_rsa_components(in, components)) return TEE_ERROR_GENERIC;

  TEE_Attribute attributes[rsa_component_count];
  for (uint32_t i = 0; i < rsa_component_count; ++i) {
    TEE_InitRefAttribute(&attributes[i], rsa_component_attributes[i], components[i].data(),
                         static_cast<uint32_t>(components[i].size()));
  }
  object_handle object;
  if (TEE_Result r = populate_object(TEE_TYPE_RSA_KEYPAIR, key_size, attributes, object); r != TEE_SUCCESS) return r;
  *key = object.release();
  if (key_size_bits != nullptr) *key_size_bits = key_size;
  return TEE_SUCCESS;
}

}  // namespace keymaster
