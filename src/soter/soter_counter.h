// The counter that tells statements apart: it lives in the TA's private storage and only ever grows.
#ifndef KEYMASTER_SOTER_SOTER_COUNTER_H_
#define KEYMASTER_SOTER_SOTER_COUNTER_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace keymaster {

/// The object: 8 bytes, the last value handed out, little-endian. The NUL belongs to its identifier.
inline constexpr char SOTER_COUNTER_OBJECT[] = "SOTER_COUNTER_OBJECT";
static_assert(sizeof SOTER_COUNTER_OBJECT == 21);

/// increase_and_get_counter advances the counter, stores it and hands out the new value; the first one is 1. The value
/// is in storage before it is handed out, so that none is given twice. TEE_ERROR_BAD_STATE for a stored counter of
/// fewer than 8 bytes, otherwise the platform's result; `*counter_out` is 0 then.
[[nodiscard]] TEE_Result increase_and_get_counter(uint64_t* counter_out);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_COUNTER_H_
