// What the registry knows of AES.
#ifndef KEYMASTER_ALGORITHMS_AES_AES_DESCRIPTOR_H_
#define KEYMASTER_ALGORITHMS_AES_AES_DESCRIPTOR_H_

#include "params/algorithm.h"

namespace keymaster {

extern const keymaster_algorithm_descriptor aes_descriptor;

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_AES_AES_DESCRIPTOR_H_
