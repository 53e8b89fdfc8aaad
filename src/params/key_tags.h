// What the key modules of all algorithms do alike with the parameters of a new key.
#ifndef KEYMASTER_PARAMS_KEY_TAGS_H_
#define KEYMASTER_PARAMS_KEY_TAGS_H_

#include <cstdint>

#include "params/key_param.h"

namespace keymaster {

/// add_param appends a parameter; want of memory is traced and answered as KM_ERROR_MEMORY_ALLOCATION_FAILED.
[[nodiscard]] keymaster_error_t add_param(keymaster_key_param_set_t* params, const keymaster_key_param_t& param);

/// add_origin refuses parameters that already tell an origin (KM_ERROR_INVALID_ARGUMENT: that is the TA's to say) and
/// adds `origin`.
[[nodiscard]] keymaster_error_t add_origin(keymaster_key_param_set_t* params, uint32_t origin);

/// read_key_size reads the one KM_TAG_KEY_SIZE of a key that is to be made. KM_ERROR_INVALID_ARGUMENT when it is absent
/// or repeated.
[[nodiscard]] keymaster_error_t read_key_size(const keymaster_key_param_set_t& params, uint32_t* bits);

/// settle_key_size compares the size of imported material with the one that the client states
/// (KM_ERROR_IMPORT_PARAMETER_MISMATCH), or states it for the client.
[[nodiscard]] keymaster_error_t settle_key_size(keymaster_key_param_set_t* params, uint64_t guessed_bits);

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_KEY_TAGS_H_
