// HMAC keys for tests: what is asked of the TA.
#ifndef TESTS_SUPPORT_HMAC_TEST_KEY_H_
#define TESTS_SUPPORT_HMAC_TEST_KEY_H_

#include "tests/support/param_list.h"

namespace testing_support {

/// What a digest allows of its keys, all in bits.
struct hmac_limits {
  std::uint32_t digest;
  std::uint32_t object_type;  // of the platform, as key data has it
  std::uint32_t shortest_key, longest_key;
  std::uint32_t longest_mac;
};
extern const std::vector<hmac_limits> every_hmac;

/// hmac_key asks for a key that signs and verifies and needs no user; `bits` 0 leaves the size to the material.
param_list hmac_key(std::uint32_t digest, std::uint32_t bits, std::uint32_t min_mac = 64);

/// hmac_length asks for an operation with MACs of `bits`.
param_list hmac_length(std::uint32_t bits);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_HMAC_TEST_KEY_H_
