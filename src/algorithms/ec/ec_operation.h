// ECDSA: signing and verification, which take their message alike and part at finish.
#ifndef KEYMASTER_ALGORITHMS_EC_EC_OPERATION_H_
#define KEYMASTER_ALGORITHMS_EC_EC_OPERATION_H_

#include "params/algorithm.h"
#include "platform/handles.h"

namespace keymaster {

struct ec_operation_t : keymaster_operation_t {
  operation_handle operation;
  operation_handle digest_operation;  // empty: the client brings the digest itself
  object_handle key;
  secret_bytes digest;
  uint32_t digest_length = 0;
  bool uses_digest = false;
  uint32_t key_size = 0;  // bits

  /// The width of a coordinate, of half a raw signature, and of the longest digest that can be signed.
  [[nodiscard]] uint32_t field_size() const { return (key_size + 7) / 8; }
};

struct ec_sign_operation_t : ec_operation_t {};
struct ec_verify_operation_t : ec_operation_t {};

/// create_ec_sign and create_ec_verify build the record; see keymaster_purpose_ops::create_operation.
/// `*error`: KM_ERROR_UNSUPPORTED_KEY_SIZE, KM_ERROR_INVALID_ARGUMENT (digest absent or repeated),
/// KM_ERROR_INCOMPATIBLE_DIGEST (MD5), KM_ERROR_UNSUPPORTED_DIGEST, KM_ERROR_MEMORY_ALLOCATION_FAILED.
[[nodiscard]] keymaster_operation_t* create_ec_sign(const operation_request& request, TEE_Result* result,
                                                    keymaster_error_t* error);
[[nodiscard]] keymaster_operation_t* create_ec_verify(const operation_request& request, TEE_Result* result,
                                                      keymaster_error_t* error);

/// ec_update takes the message. Without a digest no more than field_size() bytes are taken, and `*input_consumed` tells
/// how many of these they were.
[[nodiscard]] TEE_Result ec_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                   std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                   uint32_t* output_length, keymaster_error_t* error);

/// ec_sign_finish answers the DER signature.
[[nodiscard]] TEE_Result ec_sign_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                        std::span<const uint8_t> input, secret_bytes& output, parameter_set& out_params,
                                        keymaster_error_t* error);

/// ec_verify_finish checks the DER signature that is its input; whatever is wrong with it, or with checking it, is
/// KM_ERROR_VERIFICATION_FAILED.
[[nodiscard]] TEE_Result ec_verify_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                          std::span<const uint8_t> input, secret_bytes& output,
                                          parameter_set& out_params, keymaster_error_t* error);

void ec_sign_free(keymaster_operation_t* op);
void ec_verify_free(keymaster_operation_t* op);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_EC_EC_OPERATION_H_
