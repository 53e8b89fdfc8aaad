// The soter resources: the device's attestation key and properties, loaded from the provisioning TA on first need and
// kept for the life of the instance.
#ifndef KEYMASTER_SOTER_SOTER_INIT_H_
#define KEYMASTER_SOTER_SOTER_INIT_H_

#include "soter/attestation_key.h"
#include "soter/soter_properties.h"
#include "tee_internal_api.h"

namespace keymaster {

/// The resources; both are empty while they are not loaded.
extern attk_key_pair_t attk_key_pair;
extern soter_prop_set_t soter_prop_set;

/// soter_start sets the state of a fresh instance: nothing is loaded, and no finger was touched. Where the TA is linked
/// into its platform, that is not what an earlier instance leaves.
void soter_start();

/// soter_ensure_ready loads the resources unless they are loaded. The result is that of soter_init_resources.
[[nodiscard]] TEE_Result soter_ensure_ready();

/// soter_init_resources loads the key, then the properties; see init_soter_key and init_soter_prop_set for its errors.
/// A failure leaves nothing loaded, and the next call tries everything again.
[[nodiscard]] TEE_Result soter_init_resources();

/// soter_ready tells whether the resources are loaded.
[[nodiscard]] bool soter_ready();

/// soter_release_resources frees the resources.
void soter_release_resources();

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_INIT_H_
