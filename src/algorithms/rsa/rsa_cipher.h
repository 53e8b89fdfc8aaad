// RSA encryption and decryption: input is gathered, and finish runs one RSA operation over all of it.
#ifndef KEYMASTER_ALGORITHMS_RSA_RSA_CIPHER_H_
#define KEYMASTER_ALGORITHMS_RSA_RSA_CIPHER_H_

#include "algorithms/rsa/rsa_operation.h"
#include "params/algorithm.h"

namespace keymaster {

struct rsa_encrypt_operation_t : rsa_operation_t {};
struct rsa_decrypt_operation_t : rsa_operation_t {};

/// create_rsa_encrypt and create_rsa_decrypt build the record; see keymaster_purpose_ops::create_operation.
/// `*error`: KM_ERROR_MEMORY_ALLOCATION_FAILED; KM_ERROR_INVALID_ARGUMENT (padding absent or repeated);
/// KM_ERROR_UNSUPPORTED_PADDING_MODE, KM_ERROR_INCOMPATIBLE_DIGEST, KM_ERROR_UNSUPPORTED_DIGEST (the scheme).
[[nodiscard]] keymaster_operation_t* create_rsa_encrypt(const operation_request& request, TEE_Result* result,
                                                        keymaster_error_t* error);
[[nodiscard]] keymaster_operation_t* create_rsa_decrypt(const operation_request& request, TEE_Result* result,
                                                        keymaster_error_t* error);

/// The updates gather up to the modulus size and output nothing. More is KM_ERROR_INVALID_INPUT_LENGTH, with nothing of
/// it consumed.
[[nodiscard]] TEE_Result rsa_encrypt_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                            uint32_t* output_length, keymaster_error_t* error);
[[nodiscard]] TEE_Result rsa_decrypt_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                            uint32_t* output_length, keymaster_error_t* error);

/// rsa_encrypt_finish answers a ciphertext of the modulus size. KM_ERROR_INVALID_INPUT_LENGTH when the padding leaves
/// no room for the message. rsa_decrypt_finish answers the plaintext at its own length, without padding at the modulus
/// size. Both: KM_ERROR_INVALID_ARGUMENT for input that the platform calls no valid block.
[[nodiscard]] TEE_Result rsa_encrypt_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, secret_bytes& output,
                                            parameter_set& out_params, keymaster_error_t* error);
[[nodiscard]] TEE_Result rsa_decrypt_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, secret_bytes& output,
                                            parameter_set& out_params, keymaster_error_t* error);

void rsa_encrypt_free(keymaster_operation_t* op);
void rsa_decrypt_free(keymaster_operation_t* op);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_RSA_RSA_CIPHER_H_
