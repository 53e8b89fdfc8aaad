// The registry: how the generic layers find algorithm code. Adding an algorithm is adding its descriptor here.
#ifndef KEYMASTER_TA_ALGORITHM_REGISTRY_H_
#define KEYMASTER_TA_ALGORITHM_REGISTRY_H_

#include <cstdint>
#include <span>

#include "params/algorithm.h"

namespace keymaster {

/// algorithms answers the descriptors, in the order that clients are told.
[[nodiscard]] std::span<const keymaster_algorithm_descriptor* const> algorithms();

/// find_algorithm answers the descriptor of an algorithm, or null.
[[nodiscard]] const keymaster_algorithm_descriptor* find_algorithm(uint32_t algorithm);

/// find_purpose_ops answers what an algorithm offers for a purpose, or null.
[[nodiscard]] const keymaster_purpose_ops* find_purpose_ops(uint32_t algorithm, uint32_t purpose);

}  // namespace keymaster

#endif  // KEYMASTER_TA_ALGORITHM_REGISTRY_H_
