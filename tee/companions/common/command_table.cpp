#include "tee/companions/common/command_table.h"

#include <algorithm>
#include <cstring>

#include "platform/trace.h"

namespace keymaster::companion {

TEE_Result dispatch(std::span<const command_row> table, uint32_t command, uint32_t param_types, TEE_Param params[4]) {
  const auto row = std::find_if(table.begin(), table.end(),
                                [command](const command_row& candidate) { return candidate.id == command; });
  if (row == table.end()) {
    TRACE_ERROR("Unknown command 0x%x\n", command);
    return TEE_ERROR_NOT_SUPPORTED;
  }
  TRACE_INFO("%s\n", row->name);
  // Before anything that the client sent is looked at.
  if (TEE_Result r = check_caller(row->caller); r != TEE_SUCCESS) return r;
  if (param_types != row->param_types) {
    TRACE_ERROR("Bad argument type 0x%x\n", param_types);
    return TEE_ERROR_BAD_PARAMETERS;
  }
  return row->handler(params);
}

TEE_Result check_room(TEE_Param& slot, uint32_t size) {
  if (size <= memref_bytes(slot).size()) return TEE_SUCCESS;
  TRACE_ERROR("The answer needs %u bytes\n", size);
  slot.memref.size = size;
  return TEE_ERROR_SHORT_BUFFER;
}

TEE_Result answer_bytes(TEE_Param& slot, std::span<const uint8_t> data) {
  const auto size = static_cast<uint32_t>(data.size());
  if (TEE_Result r = check_room(slot, size); r != TEE_SUCCESS) return r;
  if (size != 0) std::memcpy(slot.memref.buffer, data.data(), size);
  slot.memref.size = size;
  return TEE_SUCCESS;
}

TEE_Result answer_outcome(TEE_Param& slot, TEE_Result result, std::span<const uint8_t> data) {
  if (result == TEE_SUCCESS) return answer_bytes(slot, data);
  slot.memref.size = 0;
  return result;
}

}  // namespace keymaster::companion
