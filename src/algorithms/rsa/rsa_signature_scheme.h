// Which digest, padding and platform algorithm a signature uses, and the block that the raw paths build themselves.
#ifndef KEYMASTER_ALGORITHMS_RSA_RSA_SIGNATURE_SCHEME_H_
#define KEYMASTER_ALGORITHMS_RSA_RSA_SIGNATURE_SCHEME_H_

#include <cstdint>

#include "algorithms/rsa/rsa_operation.h"

namespace keymaster {

/// What the platform is asked for. `digest_algorithm` 0: the client signs raw bytes, and RSA runs without padding.
struct rsa_signature_scheme {
  uint32_t rsa_algorithm = 0;
  uint32_t digest_algorithm = 0;
};

/// digest_size answers the bytes of a digest, 0 for KM_DIGEST_NONE and unknown ones.
[[nodiscard]] uint32_t digest_size(uint32_t digest);

/// choose_signature_scheme looks the scheme up. KM_ERROR_UNSUPPORTED_DIGEST for a digest above SHA-512, whatever the
/// padding; KM_ERROR_UNSUPPORTED_PADDING_MODE for a padding that does not sign; KM_ERROR_INCOMPATIBLE_DIGEST for a
/// digest that the padding does not take.
[[nodiscard]] keymaster_error_t choose_signature_scheme(uint32_t padding, uint32_t digest,
                                                        rsa_signature_scheme* scheme);

/// prepare_signature_operation sets up the sign or verify record `op` from the begin parameters: key, digest operation,
/// RSA operation. Steps and errors are those of create_rsa_sign and create_rsa_verify.
[[nodiscard]] TEE_Result prepare_signature_operation(rsa_operation_t& op, const operation_request& request,
                                                     keymaster_error_t* error);

/// raw_message_limit is the most that the raw path of `op` takes: the modulus size, less 11 for PKCS#1 v1.5 padding
/// (RFC 8017, section 9.2). Negative for keys that are too short for the padding.
[[nodiscard]] int64_t raw_message_limit(const rsa_operation_t& op);

/// update_signature_operation feeds `input` to the digest of `op`, or gathers it where there is none: see
/// gather_message. Sign and verify take their messages alike.
[[nodiscard]] bool update_signature_operation(rsa_operation_t& op, std::span<const uint8_t> input, uint32_t* total);

/// build_pkcs1_block makes the buffer of `op` the block 00 01 FF…FF 00 message (RFC 8017, section 9.2, without the
/// DigestInfo: the caller signs what it wants signed). False, with the buffer as it was: the message does not fit.
[[nodiscard]] bool build_pkcs1_block(rsa_operation_t& op);

/// finish_digest replaces the buffer of `op` by the digest of the input. The digest's size is in `*length`.
[[nodiscard]] TEE_Result finish_digest(rsa_operation_t& op, uint32_t* length);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_RSA_RSA_SIGNATURE_SCHEME_H_
