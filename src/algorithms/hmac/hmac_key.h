// HMAC keys: made and taken in, each for one digest, and never given out. The entries of the HMAC descriptor; see
// params/algorithm.h for what their arguments mean.
//
// Key data: u32 key size in bits, u32 object type of the platform (which tells the digest), then the key.
#ifndef KEYMASTER_ALGORITHMS_HMAC_HMAC_KEY_H_
#define KEYMASTER_ALGORITHMS_HMAC_HMAC_KEY_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// hmac_generate_key makes a key of KM_TAG_KEY_SIZE bits for KM_TAG_DIGEST and adds KM_TAG_ORIGIN. `*error`:
/// KM_ERROR_INVALID_ARGUMENT (KM_TAG_ORIGIN given; size or shortest MAC absent or repeated),
/// KM_ERROR_UNSUPPORTED_KEY_SIZE, KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH, KM_ERROR_UNSUPPORTED_DIGEST (absent or repeated
/// too), KM_ERROR_UNKNOWN_ERROR (no memory; the platform's key is of another size). Otherwise the platform's result.
[[nodiscard]] TEE_Result hmac_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data,
                                           keymaster_error_t* error);

/// hmac_import_key takes a raw key; errors as of hmac_generate_key, and KM_ERROR_IMPORT_PARAMETER_MISMATCH,
/// KM_ERROR_MEMORY_ALLOCATION_FAILED.
[[nodiscard]] TEE_Result hmac_import_key(keymaster_key_param_set_t* params, std::span<const uint8_t> material,
                                         secret_bytes& key_data, keymaster_error_t* error);

/// hmac_export_key refuses: KM_ERROR_UNSUPPORTED_KEY_FORMAT.
[[nodiscard]] TEE_Result hmac_export_key(std::span<const uint8_t> key_data, uint8_t* output, uint32_t* output_length,
                                         keymaster_error_t* error);

/// hmac_resolve_key_data makes a key object from key data and tells its type. `*key` is the caller's to free, null on
/// failure; `*key_size_bits` may be null. TEE_ERROR_GENERIC for key data that ends too soon; otherwise the platform's
/// result.
[[nodiscard]] TEE_Result hmac_resolve_key_data(std::span<const uint8_t> key_data, TEE_ObjectHandle* key,
                                               uint32_t* object_type, uint32_t* key_size_bits,
                                               keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_HMAC_HMAC_KEY_H_
