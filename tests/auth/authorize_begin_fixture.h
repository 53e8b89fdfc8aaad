// Begin's policy with algorithms of the test's own: this program defines the registry's look-ups itself.
#ifndef TESTS_AUTH_AUTHORIZE_BEGIN_FIXTURE_H_
#define TESTS_AUTH_AUTHORIZE_BEGIN_FIXTURE_H_

#include "params/algorithm.h"
#include "tests/auth/auth_fixture.h"

namespace testing_support {

/// What the stand-in registry knows. Every algorithm of the four has all purposes, and takes padding, block mode and
/// digest from the request where it has them once, unless a test says otherwise.
struct fake_registry {
  bool has_algorithm = true;
  bool has_purpose_ops = true;
  keymaster::keymaster_purpose_ops ops;

  fake_registry();
};
extern fake_registry registry;

struct begin_answer {
  keymaster::keymaster_error_t error;
  std::vector<std::string> errors;  // what was traced at error level
};

class AuthorizeBeginTest : public AuthTest {
 protected:
  void SetUp() override;

  /// begin authorizes an operation and expects it to cost nothing.
  begin_answer begin(const param_list& key, std::uint32_t purpose = keymaster::KM_PURPOSE_SIGN,
                     const param_list& params = {});
  begin_answer begin_blob(const bytes& blob, const param_list& key, std::uint32_t purpose = keymaster::KM_PURPOSE_SIGN,
                          const param_list& params = {});

  void expect_granted(const begin_answer& answer);
  void expect_refused(const begin_answer& answer, keymaster::keymaster_error_t error,
                      const std::vector<std::string>& lines);

  /// A key of `algorithm` that allows all four purposes.
  static param_list key_of(std::uint32_t algorithm = keymaster::KM_ALGORITHM_HMAC);

  const bytes blob = pattern(150, 1);
};

}  // namespace testing_support

#endif  // TESTS_AUTH_AUTHORIZE_BEGIN_FIXTURE_H_
