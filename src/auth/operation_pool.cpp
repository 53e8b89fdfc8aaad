#include "auth/operation_pool.h"

#include <algorithm>
#include <array>

#include "platform/trace.h"

namespace keymaster {
namespace {

struct pool_slot {
  keymaster_operation_t* operation;
  uint32_t handle;  // stays behind when the slot is freed, so that the handle is not given out again soon
  bool free;
};

constinit std::array<pool_slot, operation_pool_size> pool = {};

/// The slot in use under `handle`, or null. A free slot is never found, whatever handle it remembers.
pool_slot* find_slot(uint32_t handle) {
  for (pool_slot& slot : pool) {
    if (!slot.free && slot.handle == handle) return &slot;
  }
  return nullptr;
}

bool is_remembered(uint32_t handle) {
  return std::any_of(pool.begin(), pool.end(), [handle](const pool_slot& slot) { return slot.handle == handle; });
}

/// Draws until the handle is usable. At most 17 of 2^32 values are refused, so the loop ends as soon as the random
/// source varies.
uint32_t draw_handle() {
  uint32_t handle = 0;
  do {
    TEE_GenerateRandom(&handle, sizeof handle);
  } while (handle == 0 || is_remembered(handle));
  return handle;
}

}  // namespace

TEE_Result operation_pool_init() {
  pool.fill(pool_slot{nullptr, 0, true});
  return TEE_SUCCESS;
}

TEE_Result operation_pool_add(keymaster_operation_t* operation, uint32_t* handle, keymaster_error_t* error) {
  *handle = 0;
  const auto slot = std::find_if(pool.begin(), pool.end(), [](const pool_slot& s) { return s.free; });
  if (slot == pool.end()) {
    TRACE_ERROR("Too many operations");
    *error = KM_ERROR_TOO_MANY_OPERATIONS;
    return TEE_SUCCESS;
  }
  *handle = draw_handle();
  *slot = pool_slot{operation, *handle, false};
  *error = KM_ERROR_OK;
  return TEE_SUCCESS;
}

void operation_pool_remove(uint32_t handle) {
  pool_slot* const slot = find_slot(handle);
  if (slot == nullptr) {
    TRACE_ERROR("Try to free invalid operation handle");
    return;
  }
  slot->operation = nullptr;
  slot->free = true;
}

keymaster_operation_t* operation_pool_get(uint32_t handle) {
  const pool_slot* const slot = find_slot(handle);
  if (slot == nullptr) {
    TRACE_ERROR("Operation handle not found");
    return nullptr;
  }
  return slot->operation;
}

}  // namespace keymaster
