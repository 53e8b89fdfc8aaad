// The key commands: 13 to 15 and 19 to 22. `request` and `response` are client memory. `*response_length` is what the
// command wrote, 0 on failure. `*error` is KM_ERROR_OK on entry; a platform failure is the result.
//
// In all of them TEE_ERROR_GENERIC with "Too short input" means a field that runs past the request or the response, and
// KM_ERROR_INVALID_KEY_BLOB a blob that is malformed or was opened with another application's id or data.
#ifndef KEYMASTER_TA_KEY_COMMANDS_H_
#define KEYMASTER_TA_KEY_COMMANDS_H_

#include <cstdint>
#include <span>

#include "params/keymaster_defs.h"
#include "tee_internal_api.h"

namespace keymaster {

/// generate_key makes a key as the marshalled parameters in `request` ask and answers its blob. On failure the response
/// is all zero. TEE_ERROR_BAD_PARAMETERS: the parameters don't unmarshal; TEE_ERROR_SHORT_BUFFER: the blob doesn't fit;
/// KM_ERROR_INVALID_ARGUMENT: no algorithm, or several; KM_ERROR_UNSUPPORTED_ALGORITHM; KM_ERROR_INVALID_TAG: several
/// blob usage requirements; and what the algorithm says.
[[nodiscard]] TEE_Result generate_key(std::span<const uint8_t> request, std::span<uint8_t> response,
                                      uint32_t* response_length, keymaster_error_t* error);

/// get_key_character_size answers the size of what get_key_character writes.
[[nodiscard]] TEE_Result get_key_character_size(std::span<const uint8_t> request, keymaster_error_t* error,
                                                uint32_t* size);

/// get_key_character answers the key's characteristics without the hidden ones. TEE_ERROR_SHORT_BUFFER: they don't fit.
[[nodiscard]] TEE_Result get_key_character(std::span<const uint8_t> request, std::span<uint8_t> response,
                                           uint32_t* response_length, keymaster_error_t* error);

/// import_key takes key material in and answers the blob and the characteristics. Failures as of generate_key.
[[nodiscard]] TEE_Result import_key(std::span<const uint8_t> request, std::span<uint8_t> response,
                                    uint32_t* response_length, keymaster_error_t* error);

/// export_key answers the public key, in the algorithm's form; for a key of the soter framework, a signed statement.
[[nodiscard]] TEE_Result export_key(std::span<const uint8_t> request, std::span<uint8_t> response,
                                    uint32_t* response_length, keymaster_error_t* error);

/// delete_key has nothing to erase and refuses only what can't be a blob.
[[nodiscard]] TEE_Result delete_key(std::span<const uint8_t> request, keymaster_error_t* error);

/// delete_all_key has nothing to erase.
[[nodiscard]] TEE_Result delete_all_key(keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_TA_KEY_COMMANDS_H_
