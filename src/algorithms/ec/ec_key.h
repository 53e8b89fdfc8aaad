// EC keys on the NIST prime curves: made, taken in, and their public half given out. The entries of the EC descriptor;
// see params/algorithm.h for what their arguments mean. No ASN.1 is involved: material and exported keys have the
// layout of the key data.
#ifndef KEYMASTER_ALGORITHMS_EC_EC_KEY_H_
#define KEYMASTER_ALGORITHMS_EC_EC_KEY_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// ec_generate_key makes a key of KM_TAG_KEY_SIZE bits and adds KM_TAG_ORIGIN. `*error`: KM_ERROR_INVALID_ARGUMENT
/// (KM_TAG_ORIGIN given; the size absent or repeated), KM_ERROR_UNSUPPORTED_KEY_SIZE, KM_ERROR_UNKNOWN_ERROR (no
/// memory; the platform's key changes while it is read). Otherwise the platform's result.
[[nodiscard]] TEE_Result ec_generate_key(keymaster_key_param_set_t* params, secret_bytes& key_data,
                                         keymaster_error_t* error);

/// ec_import_key takes key data and adds KM_TAG_ORIGIN and, where the client left it out, KM_TAG_KEY_SIZE. The point is
/// not looked at, and bytes behind D are dropped. TEE_ERROR_GENERIC for material that ends too soon. `*error`:
/// KM_ERROR_INVALID_ARGUMENT (KM_TAG_ORIGIN given), KM_ERROR_IMPORT_PARAMETER_MISMATCH, KM_ERROR_UNSUPPORTED_KEY_SIZE,
/// KM_ERROR_MEMORY_ALLOCATION_FAILED.
[[nodiscard]] TEE_Result ec_import_key(keymaster_key_param_set_t* params, std::span<const uint8_t> material,
                                       secret_bytes& key_data, keymaster_error_t* error);

/// ec_export_key writes size, X and Y. KM_ERROR_UNKNOWN_ERROR when they don't fit.
[[nodiscard]] TEE_Result ec_export_key(std::span<const uint8_t> key_data, uint8_t* output, uint32_t* output_length,
                                       keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_EC_EC_KEY_H_
