// The head of every operation record. An algorithm's record derives from it and appends its own members; the generic
// commands know the head alone.
#ifndef KEYMASTER_PARAMS_OPERATION_H_
#define KEYMASTER_PARAMS_OPERATION_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

struct keymaster_operation_t;

/// Releases an algorithm's record and its platform objects, but not the authorization set.
using operation_free = void (*)(keymaster_operation_t* op);

/// Feeds `input` (client memory: each byte goes to the platform once) and writes up to `*output_length` bytes to
/// `output` (client memory too). `*input_consumed` is the input's length on entry and may be lowered; `*output_length`
/// tells the bytes written.
using operation_update = TEE_Result (*)(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                        std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                                        uint32_t* output_length, keymaster_error_t* error);

/// Ends the operation. `input` is client memory and matters to verification alone, which reads its signature there.
/// `output` receives what the operation yields, or stays empty.
using operation_finish = TEE_Result (*)(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                                        std::span<const uint8_t> input, secret_bytes& output, parameter_set& out_params,
                                        keymaster_error_t* error);

struct keymaster_operation_t {
  /// The key's characteristics, owned by the operation from begin on.
  keymaster_key_param_set_t authorization_set = {nullptr, 0};
  operation_free free = nullptr;
  operation_update update = nullptr;  // null: the algorithm has none
  operation_finish finish = nullptr;  // null: the algorithm has none
  /// What begin was asked for: public-key operations stay unrestricted after begin as well.
  uint32_t purpose = 0;
};

/// What a purpose's constructor builds a record from, and where it reports.
struct operation_request {
  std::span<const uint8_t> key_data;                 // the algorithm's key data, from the opened blob
  const keymaster_key_param_set_t& characteristics;  // what the blob says of the key
  const keymaster_key_param_set_t& in_params;        // what the client asks for
  parameter_set& out_params;                         // what the client gets back, such as a drawn nonce
};

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_OPERATION_H_
