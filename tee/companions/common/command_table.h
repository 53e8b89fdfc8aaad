// The commands of a companion as one table, and the one place that checks what holds for all of them.
#ifndef TEE_COMPANIONS_COMMON_COMMAND_TABLE_H_
#define TEE_COMPANIONS_COMMON_COMMAND_TABLE_H_

#include <cstdint>
#include <span>

#include "tee/companions/common/caller.h"
#include "tee_internal_api.h"

namespace keymaster::companion {

/// One command. The handler sees slots of the types that the row names, and clients that the row allows.
struct command_row {
  uint32_t id;
  const char* name;  // for the trace
  uint32_t param_types;
  caller_rule caller;
  TEE_Result (*handler)(TEE_Param params[4]);
};

/// The commands of this TA. Each companion defines it, and leaves the entry points to what it shares with the others.
extern const std::span<const command_row> commands;

/// dispatch carries out one command of `table`. TEE_ERROR_NOT_SUPPORTED: unknown; the result of check_caller: not for
/// this client; TEE_ERROR_BAD_PARAMETERS: other parameter types than the command's. No slot is touched then. Otherwise
/// the handler's result.
[[nodiscard]] TEE_Result dispatch(std::span<const command_row> table, uint32_t command, uint32_t param_types,
                                  TEE_Param params[4]);

/// memref_bytes views a memory reference. A null buffer is empty, whatever size comes with it.
[[nodiscard]] inline std::span<uint8_t> memref_bytes(const TEE_Param& slot) {
  if (slot.memref.buffer == nullptr) return {};
  return {static_cast<uint8_t*>(slot.memref.buffer), slot.memref.size};
}

/// check_room tells whether `size` bytes have room in an output slot, before they are made. TEE_ERROR_SHORT_BUFFER,
/// with a trace line and the size in the slot, when they haven't; else the slot stays as it was.
[[nodiscard]] TEE_Result check_room(TEE_Param& slot, uint32_t size);

/// answer_bytes copies `data` to an output slot and sets its size. Errors of check_room; nothing is copied then.
[[nodiscard]] TEE_Result answer_bytes(TEE_Param& slot, std::span<const uint8_t> data);

/// answer_outcome is answer_bytes of what came out with `result`. A failure is handed on, and answers no bytes.
[[nodiscard]] TEE_Result answer_outcome(TEE_Param& slot, TEE_Result result, std::span<const uint8_t> data);

}  // namespace keymaster::companion

#endif  // TEE_COMPANIONS_COMMON_COMMAND_TABLE_H_
