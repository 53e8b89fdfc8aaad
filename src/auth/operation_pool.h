// The table of live operations: 16 slots, shared by all sessions of the instance, never grown.
//
// The pool finds operations by their handle and owns none: whoever removes one has released it. Handles are random, not
// bound to a session, and never time out.
#ifndef KEYMASTER_AUTH_OPERATION_POOL_H_
#define KEYMASTER_AUTH_OPERATION_POOL_H_

#include <cstdint>

#include "params/operation.h"

namespace keymaster {

inline constexpr uint32_t operation_pool_size = 16;

/// operation_pool_init empties the pool. Always TEE_SUCCESS.
[[nodiscard]] TEE_Result operation_pool_init();

/// operation_pool_add files `operation` under a fresh handle, which is nonzero and none that a slot still remembers.
/// The result is always TEE_SUCCESS; `*error` tells: KM_ERROR_OK, or KM_ERROR_TOO_MANY_OPERATIONS with `*handle` 0.
[[nodiscard]] TEE_Result operation_pool_add(keymaster_operation_t* operation, uint32_t* handle,
                                            keymaster_error_t* error);

/// operation_pool_remove forgets the operation under `handle`; an unknown handle is traced and changes nothing.
void operation_pool_remove(uint32_t handle);

/// operation_pool_get answers the operation under `handle`, or null with a trace line.
[[nodiscard]] keymaster_operation_t* operation_pool_get(uint32_t handle);

}  // namespace keymaster

#endif  // KEYMASTER_AUTH_OPERATION_POOL_H_
