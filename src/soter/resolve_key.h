// RSA key objects from the key data of a blob, for those who only want to know whether they got one.
#ifndef KEYMASTER_SOTER_RESOLVE_KEY_H_
#define KEYMASTER_SOTER_RESOLVE_KEY_H_

#include <cstdint>
#include <span>

#include "tee_internal_api.h"

namespace keymaster {

/// resolve_key_from_data makes a key-pair object from RSA key data and tells its size in bits. The object is the
/// caller's to free; null, with a trace line, when there is none.
[[nodiscard]] TEE_ObjectHandle resolve_key_from_data(std::span<const uint8_t> key_data, uint32_t* key_size_bits);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_RESOLVE_KEY_H_
