// MACs: made and checked. The digest is the key's; the length is the client's choice at begin.
#ifndef KEYMASTER_ALGORITHMS_HMAC_HMAC_OPERATION_H_
#define KEYMASTER_ALGORITHMS_HMAC_HMAC_OPERATION_H_

#include "params/algorithm.h"
#include "platform/handles.h"

namespace keymaster {

struct hmac_operation_t : keymaster_operation_t {
  operation_handle operation;
  object_handle key;
  uint32_t key_size = 0;    // bits
  uint32_t mac_length = 0;  // bits

  [[nodiscard]] uint32_t mac_size() const { return mac_length / 8; }
};

struct hmac_sign_operation_t : hmac_operation_t {};
struct hmac_verify_operation_t : hmac_operation_t {};

/// create_hmac_sign and create_hmac_verify build the record; see keymaster_purpose_ops::create_operation. Both need
/// KM_TAG_MAC_LENGTH, on which they set no bounds. `*error`: KM_ERROR_INVALID_ARGUMENT (it is absent or repeated),
/// KM_ERROR_INVALID_KEY_BLOB (the key is of no HMAC type).
[[nodiscard]] keymaster_operation_t* create_hmac_sign(const operation_request& request, TEE_Result* result,
                                                      keymaster_error_t* error);
[[nodiscard]] keymaster_operation_t* create_hmac_verify(const operation_request& request, TEE_Result* result,
                                                        keymaster_error_t* error);

/// hmac_update takes the message.
[[nodiscard]] TEE_Result hmac_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                     std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                     uint32_t* output_length, keymaster_error_t* error);

/// hmac_sign_finish answers the leftmost mac_size() bytes of the MAC. KM_ERROR_MEMORY_ALLOCATION_FAILED;
/// KM_ERROR_UNKNOWN_ERROR when the digest has fewer.
[[nodiscard]] TEE_Result hmac_sign_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                          std::span<const uint8_t> input, secret_bytes& output,
                                          parameter_set& out_params, keymaster_error_t* error);

/// hmac_verify_finish compares the MAC that is its input over mac_size() bytes: KM_ERROR_VERIFICATION_FAILED when it
/// differs or is shorter. Bytes behind them are not looked at.
[[nodiscard]] TEE_Result hmac_verify_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                            std::span<const uint8_t> input, secret_bytes& output,
                                            parameter_set& out_params, keymaster_error_t* error);

void hmac_sign_free(keymaster_operation_t* op);
void hmac_verify_free(keymaster_operation_t* op);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_HMAC_HMAC_OPERATION_H_
