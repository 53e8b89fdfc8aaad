// RSA key objects from the key data of a blob or from a blob, for those who only want to know whether they got one.
#ifndef KEYMASTER_SOTER_RESOLVE_KEY_H_
#define KEYMASTER_SOTER_RESOLVE_KEY_H_

#include <cstdint>
#include <span>

#include "tee_internal_api.h"

namespace keymaster {

/// resolve_key_from_data makes a key-pair object from RSA key data and tells its size in bits. The object is the
/// caller's to free. Null, with `*key_size_bits` 0, when there is none, or when n or e is empty.
[[nodiscard]] TEE_ObjectHandle resolve_key_from_data(std::span<const uint8_t> key_data, uint32_t* key_size_bits);

/// retrieve_key_from_pobj opens a sealed blob and makes a key-pair object of what is in it. No application id is asked
/// for and no use is counted: that is between the client and the key that is signed with. Null, with `*key_size_bits`
/// 0, when the blob does not open, is of another algorithm than RSA, or as with resolve_key_from_data.
[[nodiscard]] TEE_ObjectHandle retrieve_key_from_pobj(std::span<const uint8_t> blob, uint32_t* key_size_bits);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_RESOLVE_KEY_H_
