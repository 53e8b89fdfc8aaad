// The use log: how often, and when, keys with a use limit or a rate limit were used since the instance began.
// A key is known by its whole blob.
#ifndef KEYMASTER_AUTH_USE_LOG_H_
#define KEYMASTER_AUTH_USE_LOG_H_

#include <cstdint>
#include <span>

#include "params/keymaster_defs.h"
#include "tee_internal_api.h"

namespace keymaster {

/// use_log_init makes the 8 free entries. TEE_ERROR_OUT_OF_MEMORY with a trace line.
[[nodiscard]] TEE_Result use_log_init();
void use_log_release();

/// check_use_count_and_add counts one more use of `blob` and answers 0, or refuses with 1:
/// KM_ERROR_KEY_MAX_OPS_EXCEEDED when `max_uses` were counted already, KM_ERROR_TOO_MANY_OPERATIONS when the log has no
/// room for another key.
[[nodiscard]] int check_use_count_and_add(std::span<const uint8_t> blob, uint32_t max_uses, keymaster_error_t* error);

/// use_log_last_use tells the system time in seconds of the last recorded use (0 for a key that was only counted).
/// False: the log knows nothing of `blob`.
[[nodiscard]] bool use_log_last_use(std::span<const uint8_t> blob, uint32_t* seconds);

/// use_log_record notes a use of `blob` now, and that its rate limit is in force for `interval_seconds`. With a full
/// log nothing is noted.
void use_log_record(std::span<const uint8_t> blob, uint32_t interval_seconds);

}  // namespace keymaster

#endif  // KEYMASTER_AUTH_USE_LOG_H_
