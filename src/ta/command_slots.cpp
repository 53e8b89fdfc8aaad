#include "ta/command_slots.h"

#include "platform/trace.h"

namespace keymaster {

TEE_Result read_field(byte_reader& in, std::span<const uint8_t>& field) {
  if (in.read_block(field)) return TEE_SUCCESS;
  TRACE_ERROR("Too short input");
  return TEE_ERROR_GENERIC;
}

}  // namespace keymaster
