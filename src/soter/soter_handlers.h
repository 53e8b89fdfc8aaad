// The soter commands: what the dispatcher calls for 0xFF00 to 0xFF04. The first four always return TEE_SUCCESS and tell
// a status in slot 0 `a`, of soter_status_t or keymaster_error_t.
#ifndef KEYMASTER_SOTER_SOTER_HANDLERS_H_
#define KEYMASTER_SOTER_SOTER_HANDLERS_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace keymaster {

/// soter_handle_generate_attk_key_pair makes sure that the attestation key is provisioned, and loads the soter
/// resources; `argument` means nothing. KM_ERROR_UNKNOWN_ERROR when they can't be loaded.
[[nodiscard]] TEE_Result soter_handle_generate_attk_key_pair(uint32_t argument, TEE_Param* slot0);

/// soter_handle_verify_attk_key_pair checks that the attestation key can be read, now and not when it was loaded.
/// SOTER_STATUS_NO_ATTK, SOTER_STATUS_UNREADABLE_ATTK.
[[nodiscard]] TEE_Result soter_handle_verify_attk_key_pair(TEE_Param* slot0);

/// soter_handle_export_attk_public_key writes the attestation key's public half to slot 2, as PEM with its NUL.
/// KM_ERROR_INVALID_ARGUMENT without a buffer; SOTER_STATUS_NO_ATTK; KM_ERROR_UNKNOWN_ERROR (also for a buffer that is
/// too small: 445 bytes are enough for any 2048-bit key with exponent 65537).
[[nodiscard]] TEE_Result soter_handle_export_attk_public_key(TEE_Param* slot2, TEE_Param* slot0);

/// soter_handle_get_device_id writes the device id to slot 2. KM_ERROR_INSUFFICIENT_BUFFER_SPACE, with the slot's size
/// as it was; KM_ERROR_UNKNOWN_ERROR.
[[nodiscard]] TEE_Result soter_handle_get_device_id(TEE_Param* slot2, TEE_Param* slot0);

/// soter_handle_setFid takes the finger id that the fingerprint TA reports, in a message as keymaster_protocol.h
/// describes it. TEE_ERROR_BAD_PARAMETERS (another size), TEE_ERROR_BAD_FORMAT (another version), or the result of
/// is_from_fp_ta, which is asked first.
[[nodiscard]] TEE_Result soter_handle_setFid(const void* buffer, uint32_t length);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_HANDLERS_H_
