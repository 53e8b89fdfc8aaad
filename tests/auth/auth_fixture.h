// What the tests of authorization share: tokens as an authenticator issues them, and a TA that has started.
#ifndef TESTS_AUTH_AUTH_FIXTURE_H_
#define TESTS_AUTH_AUTH_FIXTURE_H_

#include "auth/auth_token.h"
#include "auth/authorization.h"
#include "tests/support/ta_scope.h"

namespace testing_support {

/// An auth token before it is signed.
struct token_fields {
  std::uint8_t version = 0;
  std::uint64_t challenge = 0;
  std::uint64_t user_id = 0;
  std::uint64_t authenticator_id = 0;
  std::uint32_t type = 0;
  std::uint64_t timestamp = 0;  // milliseconds since boot

  /// mint gives the 69 bytes, signed with libcrypto under `seed`.
  [[nodiscard]] bytes mint(std::span<const std::uint8_t> seed) const;
};

/// number_param makes a parameter with a value of any width.
[[nodiscard]] keymaster::keymaster_key_param_t number_param(std::uint32_t tag, std::uint64_t value);

class AuthTest : public TaUnitTest {
 protected:
  static constexpr TEE_Time start_system = {7200, 250};
  static constexpr TEE_Time start_ree = {1'700'000'000, 500};
  static constexpr std::uint64_t now_ms = 7'200'250;  // of the system clock

  void SetUp() override;
  void TearDown() override;

  /// restart begins the instance's authorization anew with these clocks, as a start of the TA does.
  void restart(TEE_Time system, TEE_Time ree);

  [[nodiscard]] bytes mint(const token_fields& fields) const { return fields.mint(device.boot_seed); }
};

}  // namespace testing_support

#endif  // TESTS_AUTH_AUTH_FIXTURE_H_
