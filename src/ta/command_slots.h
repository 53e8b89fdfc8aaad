// The slots of a command as the handlers want them, and what becomes of them at the end.
#ifndef KEYMASTER_TA_COMMAND_SLOTS_H_
#define KEYMASTER_TA_COMMAND_SLOTS_H_

#include <cstdint>
#include <span>

#include "params/keymaster_defs.h"
#include "platform/bytes.h"
#include "platform/cursor.h"
#include "platform/trace.h"
#include "tee_internal_api.h"

namespace keymaster {

/// memref_bytes views a memory reference. A null buffer is empty, whatever size comes with it.
[[nodiscard]] inline std::span<uint8_t> memref_bytes(const TEE_Param& slot) {
  if (slot.memref.buffer == nullptr) return {};
  return {static_cast<uint8_t*>(slot.memref.buffer), slot.memref.size};
}

/// settle_error is the one place that decides what a failure without an error of its own becomes: a client that reads
/// only the Keymaster error must never take a failure for success.
[[nodiscard]] inline keymaster_error_t settle_error(TEE_Result result, keymaster_error_t error) {
  return result != TEE_SUCCESS && error == KM_ERROR_OK ? KM_ERROR_UNKNOWN_ERROR : error;
}

/// read_field reads a length-prefixed field of a request as a view of client memory. TEE_ERROR_GENERIC, with a trace
/// line, when it runs past the request.
[[nodiscard]] TEE_Result read_field(byte_reader& in, std::span<const uint8_t>& field);

/// copy_field copies a small field out of client memory, which may change while a command runs. False, with a trace
/// line and KM_ERROR_MEMORY_ALLOCATION_FAILED: the heap is exhausted.
template <bool Secret>
[[nodiscard]] bool copy_field(std::span<const uint8_t> field, basic_bytes<Secret>& copy, keymaster_error_t* error) {
  if (copy.copy_of(field)) return true;
  TRACE_ERROR("Out of memory");
  *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  return false;
}

}  // namespace keymaster

#endif  // KEYMASTER_TA_COMMAND_SLOTS_H_
