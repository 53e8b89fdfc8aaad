// A device whose password authenticator a test talks to.
#ifndef TESTS_COMPANIONS_AUTHENTICATOR_AUTHENTICATOR_FIXTURE_H_
#define TESTS_COMPANIONS_AUTHENTICATOR_AUTHENTICATOR_FIXTURE_H_

#include "tee/companions/authenticator/authenticator_protocol.h"
#include "tests/companions/companion_fixture.h"

namespace testing_support {

/// What the authenticator is asked with: the types of its commands.
inline constexpr std::uint32_t enrol_types = 0x2651;
inline constexpr std::uint32_t verify_types = 0x0653;

/// The user of the tests, and somebody else.
inline constexpr std::uint32_t alice = 1000, bob = 1001;

/// What a command answered: the whole buffer, what became of its size, and the values (slot 3 of enrol, 0 of verify).
struct password_answer {
  TEE_Result result = 0xDEADBEEF;
  bytes output;
  std::uint32_t size = 0;
  std::uint32_t a = 0;
  std::uint32_t b = 0;

  [[nodiscard]] std::uint64_t secure_id() const { return std::uint64_t{b} << 32 | a; }
};

class AuthenticatorTest : public CompanionTest {
 protected:
  AuthenticatorTest()
      : CompanionTest(AUTHENTICATOR_TA_UUID, "PASSWORD",
                      {"pwauth.key", "pwauth.authid", "pwauth.fail.1000", "pwauth.fail.1001"}) {}

  const bytes right = from_text("correct horse"), wrong = from_text("incorrect horse");

  password_answer enrol(std::uint32_t uid, const bytes& password, const bytes& handle = {}, const bytes& present = {},
                        std::size_t capacity = 61);
  password_answer verify(std::uint32_t uid, const bytes& handle, const bytes& password, std::uint64_t challenge = 0,
                         std::size_t capacity = 69);

  /// must_enrol and must_verify throw unless the command succeeds.
  password_answer must_enrol(std::uint32_t uid, const bytes& password);
  bytes must_verify(std::uint32_t uid, const bytes& handle, const bytes& password, std::uint64_t challenge = 0);

  /// expect_denied: the password is not looked upon as right, there is no answer, and it counts as a failure.
  void expect_denied(std::uint32_t uid, const bytes& handle, const bytes& password);
  /// expect_busy: the attempt is not taken, whatever it is, for just so long; it counts as nothing.
  void expect_busy(std::uint32_t uid, const bytes& handle, const bytes& password, std::uint32_t wait_ms);
  /// fail brings the user this many failures more, waiting where it must be waited.
  void fail(std::uint32_t uid, const bytes& handle, int times);

  /// failures answers what is on record of a user: how often, and when last.
  struct record {
    std::uint32_t count = 0;
    std::uint64_t last_ms = 0;
    bool operator==(const record&) const = default;
  };
  record failures(std::uint32_t uid);
  void set_failures(std::uint32_t uid, const record& content);
};

[[nodiscard]] bytes enrol_request(const bytes& handle, const bytes& present, const bytes& password);
[[nodiscard]] bytes verify_request(std::uint64_t challenge, const bytes& handle, const bytes& password);

}  // namespace testing_support

#endif  // TESTS_COMPANIONS_AUTHENTICATOR_AUTHENTICATOR_FIXTURE_H_
