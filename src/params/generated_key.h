// From a generated key object to key data, the same for every algorithm.
#ifndef KEYMASTER_PARAMS_GENERATED_KEY_H_
#define KEYMASTER_PARAMS_GENERATED_KEY_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "platform/cursor.h"
#include "platform/handles.h"

namespace keymaster {

/// A key_generator makes key data as `params` ask, and may leave a part of it behind when it fails.
using key_generator = TEE_Result (*)(keymaster_key_param_set_t* params, secret_bytes& key_data,
                                     keymaster_error_t* error);

/// generate_key_data runs `generate`, and hands out key data with success alone.
[[nodiscard]] TEE_Result generate_key_data(key_generator generate, keymaster_key_param_set_t* params,
                                           secret_bytes& key_data, keymaster_error_t* error);

/// measure_attributes learns the lengths of a key's values, each offered the whole of `scratch`. The platform's result;
/// nothing is traced, for the caller may try again.
[[nodiscard]] TEE_Result measure_attributes(const object_handle& key, std::span<const uint32_t> attributes,
                                            std::span<uint8_t> scratch, std::span<uint32_t> lengths);

/// measured_size is the size of key data: the key size, then each value behind its length.
[[nodiscard]] uint64_t measured_size(std::span<const uint32_t> lengths);

/// write_attributes writes key data of measured_size() bytes; every value goes straight to its place. A value that is
/// not as long as measured is KM_ERROR_UNKNOWN_ERROR.
[[nodiscard]] TEE_Result write_attributes(const object_handle& key, uint32_t key_size,
                                          std::span<const uint32_t> attributes, std::span<const uint32_t> lengths,
                                          secret_bytes& key_data, keymaster_error_t* error);

/// write_attribute reads a value of `place.size()` bytes into key data. Another length is KM_ERROR_UNKNOWN_ERROR.
[[nodiscard]] TEE_Result write_attribute(const object_handle& key, uint32_t attribute, std::span<uint8_t> place,
                                         keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_GENERATED_KEY_H_
