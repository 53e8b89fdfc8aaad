// AES encryption. The ciphertext streams out of update; finish gives the padded last block and the GCM tag.
#ifndef KEYMASTER_ALGORITHMS_AES_AES_ENCRYPT_H_
#define KEYMASTER_ALGORITHMS_AES_AES_ENCRYPT_H_

#include "algorithms/aes/aes_operation.h"
#include "params/algorithm.h"

namespace keymaster {

struct aes_encrypt_operation_t : aes_operation_t {};

/// create_aes_encrypt builds the record; errors as of prepare_aes_operation and start_aes_operation.
[[nodiscard]] keymaster_operation_t* create_aes_encrypt(const operation_request& request, TEE_Result* result,
                                                        keymaster_error_t* error);

/// aes_encrypt_update encrypts all of `input`. KM_ERROR_INVALID_TAG for associated data that is out of place; otherwise
/// the platform's result, TEE_ERROR_SHORT_BUFFER among them.
[[nodiscard]] TEE_Result aes_encrypt_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                            uint32_t* output_length, keymaster_error_t* error);

/// aes_encrypt_finish ends the stream. KM_ERROR_INVALID_INPUT_LENGTH for an incomplete block without padding;
/// KM_ERROR_UNKNOWN_ERROR when the platform outputs other sizes than the mode has.
[[nodiscard]] TEE_Result aes_encrypt_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, secret_bytes& output,
                                            parameter_set& out_params, keymaster_error_t* error);

void aes_encrypt_free(keymaster_operation_t* op);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_AES_AES_ENCRYPT_H_
