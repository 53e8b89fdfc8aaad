// What the companions ask of the platform, and how they run: one instance each, which serves all sessions one command
// after the other and ends with the last. None of them keeps state outside storage.
#ifndef TEE_COMPANIONS_COMMON_COMPANION_LIMITS_H_
#define TEE_COMPANIONS_COMMON_COMPANION_LIMITS_H_

#include <cstdint>

#include "tee_ta_image.h"

namespace keymaster::companion {

inline constexpr uint32_t stack_size = 0x2000;  // 8 KiB
inline constexpr uint32_t heap_size = 0x80000;  // 512 KiB
inline constexpr uint32_t flags =
    TEE_TA_FLAG_USER_MODE | TEE_TA_FLAG_EXEC_DDR | TEE_TA_FLAG_SINGLE_INSTANCE | TEE_TA_FLAG_MULTI_SESSION;

/// What a companion is for, in a few words: its own to define, beside tee_trace_prefix.
extern const char ta_description[];

}  // namespace keymaster::companion

#endif  // TEE_COMPANIONS_COMMON_COMPANION_LIMITS_H_
