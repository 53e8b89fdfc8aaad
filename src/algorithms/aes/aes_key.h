// AES keys: made, taken in, never given out. The entries of the AES descriptor; see params/algorithm.h for what their
// arguments mean.
//
// Key data: u32 key size in bits, then the key.
#ifndef KEYMASTER_ALGORITHMS_AES_AES_KEY_H_
#define KEYMASTER_ALGORITHMS_AES_AES_KEY_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// aes_generate_key makes a key of KM_TAG_KEY_SIZE bits and adds KM_TAG_ORIGIN. A key for GCM, or for no block mode at
/// all, must state its shortest tag. `*error`: KM_ERROR_INVALID_ARGUMENT (KM_TAG_ORIGIN given; the size absent or
/// repeated), KM_ERROR_UNSUPPORTED_KEY_SIZE, KM_ERROR_MISSING_MIN_MAC_LENGTH, KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH
/// (outside 96 to 128 or no multiple of 8), KM_ERROR_UNKNOWN_ERROR (the platform's key is of another size). Otherwise
/// the platform's result, or TEE_ERROR_OUT_OF_MEMORY.
[[nodiscard]] TEE_Result aes_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data,
                                          keymaster_error_t* error);

/// aes_import_key takes a raw key and adds KM_TAG_ORIGIN and, where the client left it out, KM_TAG_KEY_SIZE. Tag
/// lengths are not looked at. `*error`: KM_ERROR_INVALID_ARGUMENT (KM_TAG_ORIGIN given),
/// KM_ERROR_IMPORT_PARAMETER_MISMATCH, KM_ERROR_UNSUPPORTED_KEY_SIZE, KM_ERROR_MEMORY_ALLOCATION_FAILED.
[[nodiscard]] TEE_Result aes_import_key(keymaster_key_param_set_t* params, std::span<const uint8_t> material,
                                        secret_bytes& key_data, keymaster_error_t* error);

/// aes_export_key refuses: KM_ERROR_UNSUPPORTED_KEY_FORMAT.
[[nodiscard]] TEE_Result aes_export_key(std::span<const uint8_t> key_data, uint8_t* output, uint32_t* output_length,
                                        keymaster_error_t* error);

/// aes_resolve_key_data makes a key object from key data. `*key` is the caller's to free, null on failure;
/// `*key_size_bits` may be null. TEE_ERROR_GENERIC for key data that ends too soon; otherwise the platform's result.
[[nodiscard]] TEE_Result aes_resolve_key_data(std::span<const uint8_t> key_data, TEE_ObjectHandle* key,
                                              uint32_t* key_size_bits, keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_AES_AES_KEY_H_
