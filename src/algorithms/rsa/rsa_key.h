// RSA keys: made, taken in, and their public half given out. The entries of the RSA descriptor; see params/algorithm.h
// for what their arguments mean.
#ifndef KEYMASTER_ALGORITHMS_RSA_RSA_KEY_H_
#define KEYMASTER_ALGORITHMS_RSA_RSA_KEY_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// rsa_generate_key makes a key of KM_TAG_KEY_SIZE bits with KM_TAG_RSA_PUBLIC_EXPONENT and adds KM_TAG_ORIGIN.
/// `*error`: KM_ERROR_INVALID_ARGUMENT (KM_TAG_ORIGIN given; one of the two tags absent or repeated),
/// KM_ERROR_UNSUPPORTED_KEY_SIZE (no multiple of 8, or above 8192), KM_ERROR_MEMORY_ALLOCATION_FAILED,
/// KM_ERROR_UNKNOWN_ERROR (the platform's key changes while it is read). Otherwise the platform's result, or
/// TEE_ERROR_OUT_OF_MEMORY for the key data.
[[nodiscard]] TEE_Result rsa_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data,
                                          keymaster_error_t* error);

/// rsa_import_key takes the eight components and adds KM_TAG_ORIGIN and, where the client left them out,
/// KM_TAG_KEY_SIZE and KM_TAG_RSA_PUBLIC_EXPONENT. The components are stored as they came, and only lengths and the
/// exponent are looked at; bytes behind the eighth are dropped. TEE_ERROR_GENERIC for material that ends too soon.
/// `*error`: KM_ERROR_INVALID_ARGUMENT (KM_TAG_ORIGIN given), KM_ERROR_IMPORT_PARAMETER_MISMATCH (size or exponent
/// differ from the tags, or an exponent of more than 8 bytes), KM_ERROR_UNSUPPORTED_KEY_SIZE,
/// KM_ERROR_MEMORY_ALLOCATION_FAILED.
[[nodiscard]] TEE_Result rsa_import_key(keymaster_key_param_set_t* params, std::span<const uint8_t> material,
                                        secret_bytes& key_data, keymaster_error_t* error);

/// rsa_export_key writes the public key as a DER SubjectPublicKeyInfo (RFC 3279). Every failure is
/// KM_ERROR_UNKNOWN_ERROR with TEE_SUCCESS, a buffer that is too small among them.
[[nodiscard]] TEE_Result rsa_export_key(std::span<const uint8_t> key_data, uint8_t* output, uint32_t* output_length,
                                        keymaster_error_t* error);

/// check_rsa_key_size refuses sizes that are no multiple of 8 or above 8192 bits. There is no lower bound: the platform
/// has its own.
[[nodiscard]] keymaster_error_t check_rsa_key_size(uint64_t key_size_bits);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_RSA_RSA_KEY_H_
