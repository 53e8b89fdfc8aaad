// What the registry knows of HMAC.
#ifndef KEYMASTER_ALGORITHMS_HMAC_HMAC_DESCRIPTOR_H_
#define KEYMASTER_ALGORITHMS_HMAC_HMAC_DESCRIPTOR_H_

#include "params/algorithm.h"

namespace keymaster {

extern const keymaster_algorithm_descriptor hmac_descriptor;

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_HMAC_HMAC_DESCRIPTOR_H_
