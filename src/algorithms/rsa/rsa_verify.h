// RSA verification, by digest or by raw block.
#ifndef KEYMASTER_ALGORITHMS_RSA_RSA_VERIFY_H_
#define KEYMASTER_ALGORITHMS_RSA_RSA_VERIFY_H_

#include "algorithms/rsa/rsa_operation.h"
#include "params/algorithm.h"

namespace keymaster {

struct rsa_verify_operation_t : rsa_operation_t {};

/// create_rsa_verify builds the record; errors as of create_rsa_sign, the soter ones excepted.
[[nodiscard]] keymaster_operation_t* create_rsa_verify(const operation_request& request, TEE_Result* result,
                                                       keymaster_error_t* error);

/// rsa_verify_update is rsa_sign_update without the soter path.
[[nodiscard]] TEE_Result rsa_verify_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                           std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                           uint32_t* output_length, keymaster_error_t* error);

/// rsa_verify_finish checks the signature that is its input: KM_ERROR_VERIFICATION_FAILED when it does not hold. On the
/// raw path a signature that is no number below the modulus is the platform's TEE_ERROR_BAD_PARAMETERS.
[[nodiscard]] TEE_Result rsa_verify_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                           std::span<const uint8_t> input, secret_bytes& output,
                                           parameter_set& out_params, keymaster_error_t* error);

void rsa_verify_free(keymaster_operation_t* op);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_RSA_RSA_VERIFY_H_
