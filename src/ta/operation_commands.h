// The operation commands: 16 to 18 and 23. Arguments as of the key commands; `handle` names an operation.
//
// An operation lives from a successful begin until finish, abort, or the first failure of an update or finish on it.
#ifndef KEYMASTER_TA_OPERATION_COMMANDS_H_
#define KEYMASTER_TA_OPERATION_COMMANDS_H_

#include <cstdint>
#include <span>

#include "params/keymaster_defs.h"
#include "tee_internal_api.h"

namespace keymaster {

/// begin opens the key blob in `request`, checks that the key may be used as asked, and starts an operation. The
/// response is the marshalled out parameters; `*handle` is 0 on failure. TEE_ERROR_BAD_PARAMETERS: the parameters don't
/// unmarshal; TEE_ERROR_SHORT_BUFFER: the response doesn't hold the out parameters; KM_ERROR_TOO_MANY_OPERATIONS; a
/// refusal of authorize_begin; and what the algorithm says.
[[nodiscard]] TEE_Result begin(uint32_t purpose, std::span<const uint8_t> request, std::span<uint8_t> response,
                               uint32_t* response_length, keymaster_error_t* error, uint32_t* handle);

/// update feeds input to an operation. `*input_consumed` tells how much it took, the response is its output.
/// KM_ERROR_INVALID_OPERATION_HANDLE: there is no such operation. Any other failure ends it; KM_ERROR_INVALID_ARGUMENT:
/// the parameters don't unmarshal.
[[nodiscard]] TEE_Result update(uint32_t handle, std::span<const uint8_t> request, std::span<uint8_t> response,
                                uint32_t* response_length, keymaster_error_t* error, uint32_t* input_consumed);

/// finish ends an operation and answers its output and out parameters, each behind its length. The operation is gone
/// before the response is written: one that doesn't fit (TEE_ERROR_GENERIC, TEE_ERROR_SHORT_BUFFER) is lost.
[[nodiscard]] TEE_Result finish(uint32_t handle, std::span<const uint8_t> request, std::span<uint8_t> response,
                                uint32_t* response_length, keymaster_error_t* error);

/// abort ends an operation without a result.
[[nodiscard]] TEE_Result abort(uint32_t handle, keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_TA_OPERATION_COMMANDS_H_
