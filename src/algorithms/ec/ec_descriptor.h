// What the registry knows of EC.
#ifndef KEYMASTER_ALGORITHMS_EC_EC_DESCRIPTOR_H_
#define KEYMASTER_ALGORITHMS_EC_EC_DESCRIPTOR_H_

#include "params/algorithm.h"

namespace keymaster {

extern const keymaster_algorithm_descriptor ec_descriptor;

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_EC_EC_DESCRIPTOR_H_
