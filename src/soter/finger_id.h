// The finger that was touched last, as the fingerprint TA tells it, and who may tell it.
#ifndef KEYMASTER_SOTER_FINGER_ID_H_
#define KEYMASTER_SOTER_FINGER_ID_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace keymaster {

/// A finger id is told in statements for so many milliseconds after the touch.
inline constexpr uint64_t soter_fid_validity = 3000;
/// What stands for "no finger".
inline constexpr uint32_t soter_no_fid = 0xFFFFFFFF;

/// soter_set_fid keeps a finger id and the system time of the touch in milliseconds.
void soter_set_fid(uint32_t fid, uint64_t time);

/// soter_get_fid answers the finger id while it is valid; it is not used up. TEE_ERROR_TIMEOUT, with soter_no_fid, once
/// it is too old, or when its time lies in the future.
[[nodiscard]] TEE_Result soter_get_fid(uint32_t* fid_out);

/// get_client_property answers who the client of the current command is. TEE_ERROR_BAD_PARAMETERS for null, otherwise
/// the platform's result.
[[nodiscard]] TEE_Result get_client_property(TEE_Identity* identity);

/// is_from_fp_ta tells whether the current command comes from the device's fingerprint TA. TEE_ERROR_ACCESS_DENIED when
/// it doesn't, or as long as the soter resources are not loaded; otherwise the result of get_client_property.
[[nodiscard]] TEE_Result is_from_fp_ta();

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_FINGER_ID_H_
