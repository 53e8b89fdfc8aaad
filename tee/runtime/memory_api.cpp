// Memory of the Internal Core API 1.1.2 (4.11).
#include <cstring>

#include "tee/runtime/memory_access.h"
#include "tee/runtime/platform_call.h"

namespace hosted_tee {
extern "C" {

void* TEE_Malloc(uint32_t size, uint32_t hint) {
  void* block = nullptr;
  platform_call_void("TEE_Malloc", [&](instance& self) {
    if (!self.faults.on_allocation()) block = self.heap.allocate(size, hint == TEE_MALLOC_FILL_ZERO);
  });
  return block;
}

void* TEE_Realloc(void* buffer, uint32_t newSize) {
  void* block = nullptr;
  platform_call_void("TEE_Realloc", [&](instance& self) {
    if (buffer != nullptr && !self.heap.owns(buffer)) panic("the block to reallocate is none of this heap");
    if (self.faults.on_allocation()) return;
    block = buffer == nullptr ? self.heap.allocate(newSize, true) : self.heap.reallocate(buffer, newSize);
  });
  return block;
}

void TEE_Free(void* buffer) {
  platform_call_void("TEE_Free", [&](instance& self) {
    if (buffer != nullptr && !self.heap.free(buffer)) panic("the block to free is none of this heap");
  });
}

TEE_Result TEE_CheckMemoryAccessRights(uint32_t accessFlags, void* buffer, uint32_t size) {
  return platform_call("TEE_CheckMemoryAccessRights", nullptr, [&](instance& self) -> TEE_Result {
    return may_access(self, accessFlags, buffer, size) ? TEE_SUCCESS : TEE_ERROR_ACCESS_DENIED;
  });
}

void TEE_SetInstanceData(const void* instanceData) {
  platform_call_void("TEE_SetInstanceData", [&](instance& self) { self.data = instanceData; });
}

const void* TEE_GetInstanceData(void) {
  const void* data = nullptr;
  platform_call_void("TEE_GetInstanceData", [&](const instance& self) { data = self.data; });
  return data;
}

// The three that follow touch nothing of the instance, so they are plain functions: code that is tested outside of an
// instance can use them too.

void TEE_MemMove(void* dest, const void* src, uint32_t size) {
  if (size != 0) std::memmove(dest, src, size);
}

// Every byte is looked at, so that the time tells nothing about where two secrets differ.
int32_t TEE_MemCompare(const void* buffer1, const void* buffer2, uint32_t size) {
  const auto* a = static_cast<const uint8_t*>(buffer1);
  const auto* b = static_cast<const uint8_t*>(buffer2);
  int32_t first_difference = 0;
  for (uint32_t i = size; i != 0; --i) {
    const int32_t difference = int32_t{a[i - 1]} - int32_t{b[i - 1]};
    const int32_t keep = (difference | -difference) >> 31;  // all ones unless the bytes are equal
    first_difference = (difference & keep) | (first_difference & ~keep);
  }
  return first_difference;
}

void TEE_MemFill(void* buffer, uint32_t x, uint32_t size) {
  if (size != 0) std::memset(buffer, static_cast<int>(x & 0xFFU), size);
}

}  // extern "C"
}  // namespace hosted_tee
