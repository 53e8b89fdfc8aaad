// The soter resources: the device's attestation key and properties, loaded from the provisioning TA on first need.
// This build has no client of the provisioning TA yet, so that the resources never become ready.
#ifndef KEYMASTER_SOTER_SOTER_INIT_H_
#define KEYMASTER_SOTER_SOTER_INIT_H_

#include "tee_internal_api.h"

namespace keymaster {

/// soter_ensure_ready loads the resources unless they are loaded. TEE_ERROR_NOT_IMPLEMENTED.
[[nodiscard]] TEE_Result soter_ensure_ready();

/// soter_ready tells whether the resources are loaded.
[[nodiscard]] bool soter_ready();

/// soter_release frees the resources, if they are loaded.
void soter_release();

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_INIT_H_
