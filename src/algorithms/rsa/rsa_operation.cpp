#include "algorithms/rsa/rsa_operation.h"

#include <cstring>

#include "algorithms/rsa/rsa_key_data.h"
#include "params/operation_record.h"
#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {

TEE_Result resolve_rsa_key(rsa_operation_t& op, std::span<const uint8_t> key_data, keymaster_error_t* error) {
  const TEE_Result resolved = resolve_into(
      op.key, error, [&](TEE_ObjectHandle* key) { return rsa_resolve_key_data(key_data, key, &op.key_size, error); });
  if (resolved != TEE_SUCCESS || *error != KM_ERROR_OK) return resolved;
  if (!op.buffer.allocate(op.modulus_size())) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return TEE_SUCCESS;
}

TEE_Result set_rsa_operation(rsa_operation_t& op, uint32_t algorithm, uint32_t mode) {
  return make_operation(algorithm, mode, op.key_size, op.key, op.operation);
}

bool gather_message(rsa_operation_t& op, std::span<const uint8_t> input, int64_t limit, uint32_t* total) {
  const uint64_t sum = uint64_t{op.buffered} + input.size();
  *total = static_cast<uint32_t>(sum);
  if (static_cast<int64_t>(sum) > limit) return false;
  if (!input.empty()) std::memcpy(op.buffer.data() + op.buffered, input.data(), input.size());
  op.buffered = *total;
  return true;
}

uint32_t missing_members(const rsa_operation_t& op) {
  return missing_handles(op) + (op.buffer ? 0U : 1U);
}

void right_align(std::span<uint8_t> block, uint32_t length) {
  if (length >= block.size()) return;
  const std::size_t front = block.size() - length;
  std::memmove(block.data() + front, block.data(), length);
  std::memset(block.data(), 0, front);
}

}  // namespace keymaster
