// Operations on keys that need the user's presence for each of them.
#include "tests/commands/command_fixture.h"
#include "tests/support/issued_token.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint64_t user = 0x1122334455667788;

class TokenTest : public CommandTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(
      1024,
      rsa_key(1024).remove(KM_TAG_NO_AUTH_REQUIRED).add(KM_TAG_USER_SECURE_ID, user).add(KM_TAG_USER_AUTH_TYPE, 2));
  const param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const bytes message = from_text("with the user present");
  const hosted_tee::accounting idle = tee.accounting();

  param_list token_for(std::uint64_t challenge, std::uint64_t user_id = user, std::uint32_t type = 2) {
    return param_list{}.add_blob(
        KM_TAG_AUTH_TOKEN, issued_token{.challenge = challenge, .user_id = user_id, .authenticator_type = type}.issue(
                               tee.world().boot_seed()));
  }
  std::uint32_t begin() { return client().must_begin(KM_PURPOSE_SIGN, blob, scheme); }

  /// expect_lost_by sends these parameters with an update and with a finish.
  void expect_lost_by(std::int32_t error, const trace_lines& lines,
                      const std::function<param_list(std::uint32_t handle)>& params) {
    std::uint32_t handle = begin();
    (void)expect_lost(refused(error, lines), handle, idle,
                      [&] { return client().update(handle, message, params(handle)); });
    handle = begin();
    (void)expect_lost(refused(error, lines), handle, idle, [&] { return client().finish(handle, {}, params(handle)); });
  }
};

TEST_F(TokenTest, ATokenForTheOperationIsNeededAtEveryStep) {
  const std::uint32_t handle = begin();
  (void)succeeds([&] { return client().update(handle, message, token_for(handle)); });
  const finish_answer done = succeeds([&] { return client().finish(handle, {}, token_for(handle)); });
  EXPECT_TRUE(key.verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message, done.data));
}

TEST_F(TokenTest, WithoutATokenTheOperationEnds) {
  const trace_lines lines = {"Auth token check failed", "Authorization failed"};
  expect_lost_by(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, lines, [](std::uint32_t) { return param_list{}; });
  expect_lost_by(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, lines, [this](std::uint32_t handle) {
    param_list twice = token_for(handle);
    return twice.add_blob(KM_TAG_AUTH_TOKEN, token_for(handle).blob(KM_TAG_AUTH_TOKEN));
  });
}

TEST_F(TokenTest, ATokenForSomethingElseEndsIt) {
  const auto lines = [](const char* why) {
    return trace_lines{why, "Auth token check failed", "Authorization failed"};
  };
  expect_lost_by(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, lines("Challenge mismatch"),
                 [this](std::uint32_t handle) { return token_for(handle + 1); });
  expect_lost_by(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, lines("Challenge mismatch"),
                 [this](std::uint32_t) { return token_for(0); });
  expect_lost_by(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, lines("User id mismatch"),
                 [this](std::uint32_t handle) { return token_for(handle, user + 1); });
  expect_lost_by(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, lines("Auth type mismatch"),
                 [this](std::uint32_t handle) { return token_for(handle, user, 1); });
}

TEST_F(TokenTest, AForgedTokenIsAnInvalidArgument) {
  expect_lost_by(KM_ERROR_INVALID_ARGUMENT, {"Authorization failed"}, [this](std::uint32_t handle) {
    return param_list{}.add_blob(KM_TAG_AUTH_TOKEN, flip(token_for(handle).blob(KM_TAG_AUTH_TOKEN), 50));
  });
  expect_lost_by(KM_ERROR_INVALID_ARGUMENT, {"Wrong auth token size, expected 69B, got 3B", "Authorization failed"},
                 [](std::uint32_t) { return param_list{}.add_blob(KM_TAG_AUTH_TOKEN, bytes(3)); });
}

TEST_F(TokenTest, VerifyingNeedsNone) {
  const bytes made = key.sign(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message);
  (void)succeeds([&] { return client().verify(blob, scheme, message, made); });
}

TEST_F(TokenTest, ATokenOfBeforeTheRebootIsForged) {
  const bytes old = issued_token{.user_id = user, .authenticator_type = 2}.issue(tee.world().boot_seed());
  tee.restart();
  param_list params = scheme;
  expect_failure(refused(KM_ERROR_INVALID_ARGUMENT, {"Authorization failed"}),
                 [&] { return client().begin(KM_PURPOSE_SIGN, blob, params.add_blob(KM_TAG_AUTH_TOKEN, old)); });
}

}  // namespace
}  // namespace testing_support
