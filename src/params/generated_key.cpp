#include "params/generated_key.h"

#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {

TEE_Result generate_key_data(key_generator generate, keymaster_key_param_set_t* params, secret_bytes& key_data,
                             keymaster_error_t* error) {
  key_data.reset();
  *error = KM_ERROR_OK;
  const TEE_Result result = generate(params, key_data, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) key_data.reset();
  return result;
}

TEE_Result measure_attributes(const object_handle& key, std::span<const uint32_t> attributes,
                              std::span<uint8_t> scratch, std::span<uint32_t> lengths) {
  for (std::size_t i = 0; i < attributes.size(); ++i) {
    lengths[i] = static_cast<uint32_t>(scratch.size());
    if (TEE_Result r = TEE_GetObjectBufferAttribute(key.get(), attributes[i], scratch.data(), &lengths[i]);
        r != TEE_SUCCESS) {
      return r;
    }
  }
  return TEE_SUCCESS;
}

uint64_t measured_size(std::span<const uint32_t> lengths) {
  uint64_t size = sizeof(uint32_t);
  for (const uint32_t length : lengths) size += sizeof(uint32_t) + uint64_t{length};
  return size;
}

TEE_Result write_attribute(const object_handle& key, uint32_t attribute, std::span<uint8_t> place,
                           keymaster_error_t* error) {
  uint32_t length = 0;
  if (TEE_Result r = read_attribute(key, attribute, place, &length); r != TEE_SUCCESS) return r;
  if (length != place.size()) {
    TRACE_ERROR("Buffer size modified, before %dB, after %dB", static_cast<uint32_t>(place.size()), length);
    *error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

TEE_Result write_attributes(const object_handle& key, uint32_t key_size, std::span<const uint32_t> attributes,
                            std::span<const uint32_t> lengths, secret_bytes& key_data, keymaster_error_t* error) {
  byte_writer out{key_data.span()};
  bool fits = out.write_u32(key_size);
  for (std::size_t i = 0; i < attributes.size(); ++i) {
    std::span<uint8_t> place;
    fits = fits && out.write_u32(lengths[i]) && out.reserve(lengths[i], place);
    if (!fits) {
      TRACE_ERROR("Too short input");
      return TEE_ERROR_GENERIC;
    }
    if (TEE_Result r = write_attribute(key, attributes[i], place, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
      return r;
    }
  }
  return TEE_SUCCESS;
}

}  // namespace keymaster
