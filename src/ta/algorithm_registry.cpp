#include "ta/algorithm_registry.h"

#include <array>

#include "algorithms/aes/aes_descriptor.h"
#include "algorithms/ec/ec_descriptor.h"
#include "algorithms/hmac/hmac_descriptor.h"
#include "algorithms/rsa/rsa_descriptor.h"

namespace keymaster {
namespace {

constexpr std::array<const keymaster_algorithm_descriptor*, 4> registry = {
    &rsa_descriptor,
    &aes_descriptor,
    &ec_descriptor,
    &hmac_descriptor,
};

}  // namespace

std::span<const keymaster_algorithm_descriptor* const> algorithms() {
  return registry;
}

const keymaster_algorithm_descriptor* find_algorithm(uint32_t algorithm) {
  for (const keymaster_algorithm_descriptor* descriptor : registry) {
    if (descriptor->algorithm == algorithm) return descriptor;
  }
  return nullptr;
}

const keymaster_purpose_ops* find_purpose_ops(uint32_t algorithm, uint32_t purpose) {
  for (const keymaster_algorithm_descriptor* descriptor : registry) {
    if (descriptor->algorithm == algorithm && descriptor->get_purpose_ops != nullptr) {
      return descriptor->get_purpose_ops(purpose);
    }
  }
  return nullptr;
}

}  // namespace keymaster
