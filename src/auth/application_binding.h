// Keys can be bound to an application: then its id and data must come with every use.
#ifndef KEYMASTER_AUTH_APPLICATION_BINDING_H_
#define KEYMASTER_AUTH_APPLICATION_BINDING_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"

namespace keymaster {

/// check_app_id_and_app_data answers 0 when the key's KM_TAG_APPLICATION_ID and KM_TAG_APPLICATION_DATA equal the
/// caller's bytes, else 1 with a trace line. Absent and empty are the same, on either side.
[[nodiscard]] int check_app_id_and_app_data(const keymaster_key_param_set_t& characteristics,
                                            std::span<const uint8_t> app_id, std::span<const uint8_t> app_data);

}  // namespace keymaster

#endif  // KEYMASTER_AUTH_APPLICATION_BINDING_H_
