// The client of the provisioning TA, which holds the device's attestation key and properties. Each call opens a session
// of its own and closes it again; nothing is kept in between.
#ifndef KEYMASTER_QUIL_QUIL_CLIENT_H_
#define KEYMASTER_QUIL_QUIL_CLIENT_H_

#include <cstdint>

#include "quil/quil_protocol.h"
#include "tee_internal_api.h"

namespace keymaster {

/// retrieve_key_from_quil fetches the box of the attestation key into `buf`, of `buf_len` bytes; `*used_length` is the
/// length that the provisioning TA reports, which the caller compares with `buf_len`. TEE_ERROR_SHORT_BUFFER for a null
/// `buf`, TEE_ERROR_BAD_PARAMETERS for a null `used_length`; otherwise the result of the session or of the command. On
/// failure `*used_length` stays as it was.
[[nodiscard]] TEE_Result retrieve_key_from_quil(void* buf, uint32_t buf_len, uint32_t* used_length);

/// retrieve_data_from_quil fetches the provisioning TA's data; otherwise as retrieve_key_from_quil.
[[nodiscard]] TEE_Result retrieve_data_from_quil(void* buf, uint32_t buf_len, uint32_t* used_length);

/// retrieve_property_from_quil fetches the property that `request` names into `output`; `*output_length` is the
/// capacity on entry, and on success the length that the provisioning TA reports. TEE_ERROR_BAD_PARAMETERS for a null
/// argument; otherwise the result of the session or of the command. On failure `*output_length` stays as it was.
[[nodiscard]] TEE_Result retrieve_property_from_quil(const quil_property_request* request, void* output,
                                                     uint32_t* output_length);

}  // namespace keymaster

#endif  // KEYMASTER_QUIL_QUIL_CLIENT_H_
