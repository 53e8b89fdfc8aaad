// AES decryption. Plaintext streams out of update, but for what may still be the tag (GCM) or the padding (PKCS#7): the
// last bytes of the stream so far are held back until more comes, or until finish has judged them.
#ifndef KEYMASTER_ALGORITHMS_AES_AES_DECRYPT_H_
#define KEYMASTER_ALGORITHMS_AES_AES_DECRYPT_H_

#include "algorithms/aes/aes_operation.h"
#include "params/algorithm.h"

namespace keymaster {

struct aes_decrypt_operation_t : aes_operation_t {
  secret_bytes tag_buffer;  // GCM: the latest bytes of the stream, at most a tag
  uint32_t tag_fill = 0;
  secret_bytes last_block;  // PKCS#7: the plaintext block that is held back; zero before there is one
};

/// create_aes_decrypt builds the record; errors as of prepare_aes_operation and start_aes_operation, and
/// KM_ERROR_MEMORY_ALLOCATION_FAILED.
[[nodiscard]] keymaster_operation_t* create_aes_decrypt(const operation_request& request, TEE_Result* result,
                                                        keymaster_error_t* error);

/// aes_decrypt_update decrypts all of `input`. The output needs room for the block held back and for every whole block
/// of the input. KM_ERROR_INVALID_TAG for associated data that is out of place; KM_ERROR_MEMORY_ALLOCATION_FAILED when
/// not even the held block fits; otherwise the platform's result.
[[nodiscard]] TEE_Result aes_decrypt_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                            uint32_t* output_length, keymaster_error_t* error);

/// aes_decrypt_finish judges the tag or the padding and answers what was held back of the text.
/// KM_ERROR_VERIFICATION_FAILED: the tag does not verify. KM_ERROR_INVALID_INPUT_LENGTH: no whole blocks.
/// KM_ERROR_INVALID_ARGUMENT: the padding is none.
[[nodiscard]] TEE_Result aes_decrypt_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, secret_bytes& output,
                                            parameter_set& out_params, keymaster_error_t* error);

void aes_decrypt_free(keymaster_operation_t* op);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_AES_AES_DECRYPT_H_
