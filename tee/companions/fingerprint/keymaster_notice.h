// How the Keymaster TA learns of a touch.
#ifndef TEE_COMPANIONS_FINGERPRINT_KEYMASTER_NOTICE_H_
#define TEE_COMPANIONS_FINGERPRINT_KEYMASTER_NOTICE_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace keymaster::fingerprint {

/// tell_keymaster tells the Keymaster TA that this finger was touched at `time_ms` of the system clock, in a session of
/// its own. What comes back is that TA's answer, or what kept it from being asked.
[[nodiscard]] TEE_Result tell_keymaster(uint32_t finger, uint64_t time_ms);

}  // namespace keymaster::fingerprint

#endif  // TEE_COMPANIONS_FINGERPRINT_KEYMASTER_NOTICE_H_
