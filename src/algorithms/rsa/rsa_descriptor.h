// What the registry knows of RSA.
#ifndef KEYMASTER_ALGORITHMS_RSA_RSA_DESCRIPTOR_H_
#define KEYMASTER_ALGORITHMS_RSA_RSA_DESCRIPTOR_H_

#include "params/algorithm.h"

namespace keymaster {

extern const keymaster_algorithm_descriptor rsa_descriptor;

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_RSA_RSA_DESCRIPTOR_H_
