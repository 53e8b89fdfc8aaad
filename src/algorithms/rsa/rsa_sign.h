// RSA signing: three paths, by digest, by raw block, and for keys of the soter framework by statement.
#ifndef KEYMASTER_ALGORITHMS_RSA_RSA_SIGN_H_
#define KEYMASTER_ALGORITHMS_RSA_RSA_SIGN_H_

#include "algorithms/rsa/rsa_operation.h"
#include "params/algorithm.h"

namespace keymaster {

struct rsa_sign_operation_t : rsa_operation_t {
  secret_bytes soter_buffer;  // the whole message of a soter key and a zero byte; empty for other keys
  uint32_t soter_capacity = 0;
  uint32_t soter_length = 0;
};

/// create_rsa_sign builds the record; see keymaster_purpose_ops::create_operation.
/// `*error`: KM_ERROR_MEMORY_ALLOCATION_FAILED; KM_ERROR_UNKNOWN_ERROR (a soter key and no soter resources);
/// KM_ERROR_INVALID_ARGUMENT (padding or digest absent or repeated); KM_ERROR_UNSUPPORTED_DIGEST,
/// KM_ERROR_UNSUPPORTED_PADDING_MODE, KM_ERROR_INCOMPATIBLE_DIGEST (the scheme, or a key too short for PSS).
[[nodiscard]] keymaster_operation_t* create_rsa_sign(const operation_request& request, TEE_Result* result,
                                                     keymaster_error_t* error);

/// rsa_sign_update gathers or digests the input and outputs nothing. Raw input beyond the block is
/// KM_ERROR_INVALID_INPUT_LENGTH, with nothing consumed.
[[nodiscard]] TEE_Result rsa_sign_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                         std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                         uint32_t* output_length, keymaster_error_t* error);

/// rsa_sign_finish signs what was gathered; its own input is not used. The signature has the size of the modulus.
[[nodiscard]] TEE_Result rsa_sign_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                         std::span<const uint8_t> input, secret_bytes& output,
                                         parameter_set& out_params, keymaster_error_t* error);

/// rsa_sign_free frees the record; members that are missing are traced.
void rsa_sign_free(keymaster_operation_t* op);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_RSA_RSA_SIGN_H_
