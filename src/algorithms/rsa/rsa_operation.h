// What the records of all RSA operations have in common.
#ifndef KEYMASTER_ALGORITHMS_RSA_RSA_OPERATION_H_
#define KEYMASTER_ALGORITHMS_RSA_RSA_OPERATION_H_

#include <cstdint>
#include <span>

#include "params/operation.h"
#include "platform/bytes.h"
#include "platform/handles.h"

namespace keymaster {

/// An RSA operation: the platform's operation with its key, and the input gathered so far. The members free themselves.
struct rsa_operation_t : keymaster_operation_t {
  operation_handle operation;
  operation_handle digest_operation;  // empty: no digest is computed here
  object_handle key;
  secret_bytes buffer;  // key size / 8 bytes, zero where nothing was gathered
  uint32_t buffered = 0;
  uint32_t digest = 0;
  uint32_t padding = 0;
  uint32_t key_size = 0;  // bits

  [[nodiscard]] uint32_t modulus_size() const { return key_size / 8; }
};

/// resolve_rsa_key makes the key of `op` from key data, and its buffer. A platform failure is the result; want of
/// memory is KM_ERROR_MEMORY_ALLOCATION_FAILED.
[[nodiscard]] TEE_Result resolve_rsa_key(rsa_operation_t& op, std::span<const uint8_t> key_data,
                                         keymaster_error_t* error);

/// set_rsa_operation makes the platform's operation of `op` for `algorithm` and `mode` and gives it the key.
[[nodiscard]] TEE_Result set_rsa_operation(rsa_operation_t& op, uint32_t algorithm, uint32_t mode);

/// gather_message appends `input` to the buffer of `op` as long as no more than `limit` bytes come together. False:
/// nothing was taken. `*total` is how many bytes there are, or would be.
[[nodiscard]] bool gather_message(rsa_operation_t& op, std::span<const uint8_t> input, int64_t limit, uint32_t* total);

/// missing_members counts which of key, operation and buffer a record lacks; freeing it traces a line for each.
[[nodiscard]] uint32_t missing_members(const rsa_operation_t& op);

/// right_align moves the `length` bytes at the start of `block` to its end and zeros what is in front of them: the
/// platform drops leading zeros of a number, and a number of fixed width has them.
void right_align(std::span<uint8_t> block, uint32_t length);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_RSA_RSA_OPERATION_H_
