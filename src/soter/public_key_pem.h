// Public RSA keys as PEM, on one line of base64 (RFC 7468 in the strict form would break it).
#ifndef KEYMASTER_SOTER_PUBLIC_KEY_PEM_H_
#define KEYMASTER_SOTER_PUBLIC_KEY_PEM_H_

#include <cstdint>
#include <span>

#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// export_rsa_public_key writes the public key of an RSA key object of `key_size` bits to `out`, as PEM with its NUL;
/// `*out_length` counts the NUL. The room behind the PEM, and all of it on failure, may hold the key's DER form.
/// TEE_ERROR_OUT_OF_MEMORY; TEE_ERROR_SHORT_BUFFER; otherwise the platform's result.
[[nodiscard]] TEE_Result export_rsa_public_key(TEE_ObjectHandle key_object, uint32_t key_size, uint8_t* out,
                                               uint32_t capacity, uint32_t* out_length);

/// wrap_pem_public_key writes a PEM block around `der`, which may lie in `out`; lengths and errors as above.
[[nodiscard]] TEE_Result wrap_pem_public_key(const uint8_t* der, uint32_t der_length, uint8_t* out, uint32_t capacity,
                                             uint32_t* out_length);

/// base64_encode makes the base64 text of `data` (RFC 4648, section 4) with its NUL, without line breaks. An empty
/// owner: out of memory.
[[nodiscard]] heap_bytes base64_encode(std::span<const uint8_t> data);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_PUBLIC_KEY_PEM_H_
