// The TA's own wall clock: the normal world's time as it was when the instance began, carried on by the system clock,
// which the normal world cannot move.
#ifndef KEYMASTER_AUTH_TIME_BASE_H_
#define KEYMASTER_AUTH_TIME_BASE_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace keymaster {

/// time_base_init reads both clocks, the system clock first.
void time_base_init();

/// time_base_now answers the wall clock.
[[nodiscard]] TEE_Time time_base_now();

/// time_base_now_ms is time_base_now in milliseconds since 1970.
[[nodiscard]] uint64_t time_base_now_ms();

}  // namespace keymaster

#endif  // KEYMASTER_AUTH_TIME_BASE_H_
