// The signature under an export statement: always RSA PKCS#1 v1.5 with SHA-256, whatever the signing key is made for.
// And the form that signed statements of both kinds leave the TA in.
#ifndef KEYMASTER_SOTER_STATEMENT_SIGNATURE_H_
#define KEYMASTER_SOTER_STATEMENT_SIGNATURE_H_

#include <cstdint>
#include <span>

#include "tee_internal_api.h"

namespace keymaster {

/// The room for the signature of an export statement: a longer key than 2048 bits does not sign one.
inline constexpr uint32_t statement_signature_capacity = 256;

/// digest_and_sign signs `message` with the key object of `key_size` bits. `*signature_length` is the capacity on
/// entry, the signature's length on return. TEE_ERROR_OUT_OF_MEMORY, otherwise the platform's result.
[[nodiscard]] TEE_Result digest_and_sign(TEE_ObjectHandle key_object, uint32_t key_size, const void* message,
                                         uint32_t message_length, uint8_t* signature, uint32_t* signature_length);

/// do_digest_with_sha digests `message` by `algorithm` (TEE_ALG_SHA256 and the like); lengths and results as above.
[[nodiscard]] TEE_Result do_digest_with_sha(uint32_t algorithm, const void* message, uint32_t length, uint8_t* digest,
                                            uint32_t* digest_length);

/// do_sign_with_rsa signs a SHA-256 digest; lengths and results as above.
[[nodiscard]] TEE_Result do_sign_with_rsa(TEE_ObjectHandle key_object, uint32_t key_size, const uint8_t* digest,
                                          uint32_t digest_length, uint8_t* signature, uint32_t* signature_length);

/// packed_statement_size is the size of a signed statement: a u32 length of the text, the text, the signature.
[[nodiscard]] constexpr uint64_t packed_statement_size(std::span<const uint8_t> text,
                                                       std::span<const uint8_t> signature) {
  return uint64_t{sizeof(uint32_t)} + text.size() + signature.size();
}

/// pack_statement writes a signed statement to `output`; `*output_length` is the capacity on entry, the bytes written
/// on return. TEE_ERROR_SHORT_BUFFER leaves it as it was.
[[nodiscard]] TEE_Result pack_statement(std::span<const uint8_t> text, std::span<const uint8_t> signature,
                                        uint8_t* output, uint32_t* output_length);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_STATEMENT_SIGNATURE_H_
