// Auth tokens as the device's authenticators issue them.
#ifndef TESTS_SUPPORT_ISSUED_TOKEN_H_
#define TESTS_SUPPORT_ISSUED_TOKEN_H_

#include <array>

#include "tests/support/bytes.h"

namespace testing_support {

/// What an authenticator says of a user. `issue` signs it with the secret that it shares with the TA until the next
/// boot.
struct issued_token {
  std::uint64_t challenge = 0;  // the operation it answers, or 0
  std::uint64_t user_id = 0;
  std::uint64_t authenticator_id = 0;
  std::uint32_t authenticator_type = 1;
  std::uint64_t timestamp_ms = 0;

  [[nodiscard]] bytes issue(const std::array<std::uint8_t, 32>& boot_seed) const;
};

}  // namespace testing_support

#endif  // TESTS_SUPPORT_ISSUED_TOKEN_H_
