// The soter commands: what the dispatcher calls for 0xFF00 to 0xFF04. They answer TEE_ERROR_NOT_IMPLEMENTED.
#ifndef KEYMASTER_SOTER_SOTER_HANDLERS_H_
#define KEYMASTER_SOTER_SOTER_HANDLERS_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace keymaster {

/// soter_handle_generate_attk_key_pair makes sure that the attestation key is provisioned.
[[nodiscard]] TEE_Result soter_handle_generate_attk_key_pair(uint32_t argument, TEE_Param* slot0);

/// soter_handle_verify_attk_key_pair checks that the attestation key can be read.
[[nodiscard]] TEE_Result soter_handle_verify_attk_key_pair(TEE_Param* slot0);

/// soter_handle_export_attk_public_key writes the attestation key's public half, as PEM, to slot 2.
[[nodiscard]] TEE_Result soter_handle_export_attk_public_key(TEE_Param* slot2, TEE_Param* slot0);

/// soter_handle_get_device_id writes the device id to slot 2.
[[nodiscard]] TEE_Result soter_handle_get_device_id(TEE_Param* slot2, TEE_Param* slot0);

/// soter_handle_setFid takes the finger id that the fingerprint TA reports.
[[nodiscard]] TEE_Result soter_handle_setFid(const void* buffer, uint32_t length);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_HANDLERS_H_
