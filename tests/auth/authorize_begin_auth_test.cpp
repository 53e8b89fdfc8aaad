// Begin: keys that are bound to users.
#include "tests/auth/authorize_begin_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace {

constexpr std::uint32_t password = 1, fingerprint = 2;
constexpr std::uint64_t user = 0xA1A1A1A1A1A1A1A1, stranger = 0xC3C3C3C3C3C3C3C3;

class AuthorizeBeginUserTest : public AuthorizeBeginTest {
 protected:
  static constexpr token_fields good = {.user_id = user, .type = password, .timestamp = now_ms};

  static param_list bound_key() {
    return key_of().add(KM_TAG_USER_SECURE_ID, user).add(KM_TAG_USER_AUTH_TYPE, password);
  }
  static param_list with(const bytes& token) { return param_list{}.add_blob(KM_TAG_AUTH_TOKEN, token); }

  void expect_needs_token(const begin_answer& answer, std::vector<std::string> lines = {}) {
    lines.emplace_back("OP AUTH NEEDED");
    expect_refused(answer, KM_OP_AUTH_NEEDED, lines);
  }
};

TEST_F(AuthorizeBeginUserTest, AKeyWithoutSecureIdNeedsNoUser) {
  expect_granted(begin(key_of()));
  expect_granted(begin(key_of().add(KM_TAG_NO_AUTH_REQUIRED)));
  expect_granted(begin(key_of().add(KM_TAG_AUTH_TIMEOUT, 10).add(KM_TAG_USER_AUTH_TYPE, password)));
}

TEST_F(AuthorizeBeginUserTest, AnInvalidTokenIsRefusedEvenForAKeyThatNeedsNone) {
  expect_refused(begin(key_of().add(KM_TAG_NO_AUTH_REQUIRED), KM_PURPOSE_SIGN, with(flip(mint(good), 50))),
                 KM_ERROR_INVALID_ARGUMENT, {});
  expect_refused(begin(key_of(), KM_PURPOSE_SIGN, with(pattern(70))), KM_ERROR_INVALID_ARGUMENT,
                 {"Wrong auth token size, expected 69B, got 70B"});
  expect_refused(begin(key_of(), KM_PURPOSE_SIGN, with({})), KM_ERROR_INVALID_ARGUMENT,
                 {"Wrong auth token size, expected 69B, got 0B"});
  token_fields newer = good;
  newer.version = 1;
  expect_refused(begin(key_of(), KM_PURPOSE_SIGN, with(mint(newer))), KM_ERROR_INVALID_ARGUMENT,
                 {"Wrong auth token version, expected 0, got 1"});
}

TEST_F(AuthorizeBeginUserTest, AnInvalidTokenIsRefusedBeforeTheAlgorithmIsLookedFor) {
  registry.has_algorithm = registry.has_purpose_ops = false;
  expect_refused(begin(key_of().add(KM_TAG_BOOTLOADER_ONLY), KM_PURPOSE_SIGN, with(flip(mint(good), 50))),
                 KM_ERROR_INVALID_ARGUMENT, {});
}

TEST_F(AuthorizeBeginUserTest, AForgedTokenDoesNotPassWhileThePlatformHasNoOperations) {
  bytes forged = mint(good);
  std::fill(forged.begin() + 37, forged.end(), std::uint8_t{0});
  ta.faults().fail_call("TEE_AllocateOperation", 1, TEE_ERROR_OUT_OF_MEMORY);
  expect_refused(begin(bound_key(), KM_PURPOSE_SIGN, with(forged)), KM_ERROR_INVALID_ARGUMENT,
                 {"AllocateOperation failed with 0xffff000c\n"});
}

TEST_F(AuthorizeBeginUserTest, ARepeatedTokenIsNone) {
  expect_needs_token(begin(bound_key(), KM_PURPOSE_SIGN, with(mint(good)).add_blob(KM_TAG_AUTH_TOKEN, mint(good))));
}

TEST_F(AuthorizeBeginUserTest, AMatchingTokenAuthenticates) {
  expect_granted(begin(bound_key(), KM_PURPOSE_SIGN, with(mint(good))));
  token_fields finger = good;
  finger.user_id = stranger;
  finger.authenticator_id = user;
  expect_granted(begin(bound_key(), KM_PURPOSE_SIGN, with(mint(finger))));
}

TEST_F(AuthorizeBeginUserTest, AtBeginATokenMayCarryAnyChallengeAndAge) {
  token_fields other = good;
  other.challenge = 0x1234;
  other.timestamp = 0;
  expect_granted(begin(bound_key(), KM_PURPOSE_SIGN, with(mint(other))));
}

TEST_F(AuthorizeBeginUserTest, WithoutATokenTheOperationNeedsOne) {
  expect_needs_token(begin(bound_key()));
}

TEST_F(AuthorizeBeginUserTest, ATokenOfAnotherUserOrTypeIsAsGoodAsNone) {
  token_fields other = good;
  other.user_id = stranger;
  expect_needs_token(begin(bound_key(), KM_PURPOSE_SIGN, with(mint(other))), {"User id mismatch"});
  other = good;
  other.type = fingerprint;
  expect_needs_token(begin(bound_key(), KM_PURPOSE_SIGN, with(mint(other))), {"Auth type mismatch"});
}

TEST_F(AuthorizeBeginUserTest, WithATimeoutTheLackOfATokenIsARefusal) {
  const param_list key = bound_key().add(KM_TAG_AUTH_TIMEOUT, 10);
  expect_refused(begin(key), KM_ERROR_KEY_USER_NOT_AUTHENTICATED, {"Auth token check failed"});
  token_fields other = good;
  other.user_id = stranger;
  expect_refused(begin(key, KM_PURPOSE_SIGN, with(mint(other))), KM_ERROR_KEY_USER_NOT_AUTHENTICATED,
                 {"User id mismatch", "Auth token check failed"});
}

TEST_F(AuthorizeBeginUserTest, WithATimeoutAPresentedTokenCountsForAWhile) {
  const param_list key = bound_key().add(KM_TAG_AUTH_TIMEOUT, 10);
  expect_granted(begin(key, KM_PURPOSE_SIGN, with(mint(good))));
  device.clock.advance(9'999);
  expect_granted(begin(key));
  device.clock.advance(1);
  expect_refused(begin(key), KM_ERROR_KEY_USER_NOT_AUTHENTICATED, {"Auth token check failed"});
}

TEST_F(AuthorizeBeginUserTest, ARepeatedTimeoutIsNone) {
  expect_needs_token(begin(bound_key().add(KM_TAG_AUTH_TIMEOUT, 10).add(KM_TAG_AUTH_TIMEOUT, 10)));
}

TEST_F(AuthorizeBeginUserTest, ATokenForAKeyWithoutUsersIsNotKept) {
  expect_granted(begin(key_of(), KM_PURPOSE_SIGN, with(mint(good))));
  expect_refused(begin(bound_key().add(KM_TAG_AUTH_TIMEOUT, 10)), KM_ERROR_KEY_USER_NOT_AUTHENTICATED,
                 {"Auth token check failed"});
}

TEST_F(AuthorizeBeginUserTest, AnyOneOfTheKeysUsersSuffices) {
  const param_list before = key_of()
                                .add(KM_TAG_USER_AUTH_TYPE, password)
                                .add(KM_TAG_USER_SECURE_ID, stranger)
                                .add(KM_TAG_USER_SECURE_ID, user);
  const param_list behind = key_of()
                                .add(KM_TAG_USER_AUTH_TYPE, password)
                                .add(KM_TAG_USER_SECURE_ID, user)
                                .add(KM_TAG_USER_SECURE_ID, stranger);
  for (const param_list& key : {before, behind}) {
    expect_refused(begin(key, KM_PURPOSE_SIGN, with(mint(good))), KM_ERROR_OK, {"User id mismatch"});
  }
}

TEST_F(AuthorizeBeginUserTest, AKeyThatNeedsAUserAndNoneIsInvalid) {
  const char* const line = "Found KM_TAG_USER_SECURE_ID but also KM_TAG_NO_AUTH_REQUIRED";
  expect_refused(begin(bound_key().add(KM_TAG_NO_AUTH_REQUIRED)), KM_ERROR_INVALID_ARGUMENT, {line});
  expect_refused(begin(bound_key().add(KM_TAG_NO_AUTH_REQUIRED).remove(KM_TAG_USER_AUTH_TYPE)),
                 KM_ERROR_INVALID_ARGUMENT, {line});
  expect_refused(begin(bound_key().add(KM_TAG_NO_AUTH_REQUIRED), KM_PURPOSE_SIGN, with(mint(good))),
                 KM_ERROR_INVALID_ARGUMENT, {line});
}

TEST_F(AuthorizeBeginUserTest, AKeyThatNeedsAUserOfNoTypeIsInvalid) {
  const char* const line = "Found KM_TAG_USER_SECURE_ID but no KM_TAG_USER_AUTH_TYPE";
  expect_refused(begin(bound_key().remove(KM_TAG_USER_AUTH_TYPE)), KM_ERROR_INVALID_ARGUMENT, {line});
  expect_refused(begin(bound_key().add(KM_TAG_USER_AUTH_TYPE, fingerprint)), KM_ERROR_INVALID_ARGUMENT, {line});
}

TEST_F(AuthorizeBeginUserTest, ManySecureIdsPresentOneTokenOnce) {
  // The token meets each of the ids, and must not push the kept tokens of other users out of the cache.
  const param_list other_key =
      key_of().add(KM_TAG_USER_SECURE_ID, stranger).add(KM_TAG_USER_AUTH_TYPE, password).add(KM_TAG_AUTH_TIMEOUT, 100);
  token_fields other = good;
  other.user_id = stranger;
  other.timestamp = now_ms - 50'000;  // the oldest in the cache
  expect_granted(begin(other_key, KM_PURPOSE_SIGN, with(mint(other))));
  param_list many = bound_key();
  for (std::uint64_t id = 1; id <= 20; ++id) many.add(KM_TAG_USER_SECURE_ID, id);
  EXPECT_EQ(begin(many, KM_PURPOSE_SIGN, with(mint(good))).error, KM_ERROR_OK);
  expect_granted(begin(other_key));
}

}  // namespace
