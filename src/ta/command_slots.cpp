#include "ta/command_slots.h"

#include "platform/trace.h"

namespace keymaster {

TEE_Result read_field(byte_reader& in, std::span<const uint8_t>& field) {
  if (in.read_block(field)) return TEE_SUCCESS;
  TRACE_ERROR("Too short input");
  return TEE_ERROR_GENERIC;
}

bool copy_field(std::span<const uint8_t> field, heap_bytes& copy, keymaster_error_t* error) {
  if (copy.copy_of(field)) return true;
  TRACE_ERROR("Out of memory");
  *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  return false;
}

}  // namespace keymaster
