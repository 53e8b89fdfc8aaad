// What the TA asks of the platform.
#ifndef KEYMASTER_TA_TA_LIMITS_H_
#define KEYMASTER_TA_TA_LIMITS_H_

#include <cstdint>

namespace keymaster {

inline constexpr uint32_t ta_stack_size = 0x2000;  // 8 KiB
inline constexpr uint32_t ta_heap_size = 0x80000;  // 512 KiB

}  // namespace keymaster

#endif  // KEYMASTER_TA_TA_LIMITS_H_
