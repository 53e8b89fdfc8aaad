// Whether a token, or one that was presented before, authenticates a secure id.
#include "auth/token_cache.h"
#include "tests/auth/auth_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

constexpr std::uint32_t password = 1, fingerprint = 2;
constexpr std::uint64_t user = 0xA1A1A1A1A1A1A1A1, finger = 0xB2B2B2B2B2B2B2B2, stranger = 0xC3C3C3C3C3C3C3C3;

class CheckAuthTest : public AuthTest {
 protected:
  /// check_auth with a token of these fields.
  int with_token(const token_fields& fields, std::uint64_t secure_id, std::uint64_t challenge = 0,
                 std::uint32_t key_type = password) {
    const parameter_set set = in_ta(param_list{}.add_blob(KM_TAG_AUTH_TOKEN, mint(fields)));
    ta.clear_trace();
    return check_auth(secure_id, challenge, &set.params[0], nullptr, number_param(KM_TAG_USER_AUTH_TYPE, key_type));
  }

  /// check_auth without a token, for a key with this timeout.
  int with_timeout(std::uint32_t seconds, std::uint64_t secure_id = user, std::uint32_t key_type = password) {
    const keymaster_key_param_t timeout = number_param(KM_TAG_AUTH_TIMEOUT, seconds);
    ta.clear_trace();
    return check_auth(secure_id, 0, nullptr, &timeout, number_param(KM_TAG_USER_AUTH_TYPE, key_type));
  }

  static constexpr token_fields good = {.challenge = 0x77,
                                        .user_id = user,
                                        .authenticator_id = finger,
                                        .type = password | fingerprint,
                                        .timestamp = now_ms};
};

TEST_F(CheckAuthTest, ATokenAuthenticatesItsUserAndItsAuthenticator) {
  EXPECT_EQ(with_token(good, user), 0);
  EXPECT_EQ(with_token(good, finger), 0);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(CheckAuthTest, AnotherUserIsAMismatch) {
  EXPECT_EQ(with_token(good, stranger), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("User id mismatch"));
}

TEST_F(CheckAuthTest, TheTypesMustShareABit) {
  EXPECT_EQ(with_token(good, user, 0, fingerprint), 0);
  EXPECT_EQ(with_token(good, user, 0, fingerprint | 0x100), 0);
  EXPECT_EQ(with_token(good, user, 0, 4), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("Auth type mismatch"));
  EXPECT_EQ(with_token(good, user, 0, 0), 1);
  EXPECT_EQ(with_token(good, user, 0, 0x01000000), 1) << "the type is big-endian in the token";
}

TEST_F(CheckAuthTest, WithoutAChallengeTheTokensOwnDoesNotMatter) {
  EXPECT_EQ(with_token(good, user, 0), 0);
}

TEST_F(CheckAuthTest, AChallengeMustBeTheTokens) {
  EXPECT_EQ(with_token(good, user, 0x77), 0);
  for (const std::uint64_t challenge : {0x76ULL, 0x78ULL, 0x7700000000000000ULL, 0x100000077ULL}) {
    EXPECT_EQ(with_token(good, user, challenge), 1);
    EXPECT_THAT(ta.errors(), ElementsAre("Challenge mismatch"));
  }
  token_fields unbound = good;
  unbound.challenge = 0;
  EXPECT_EQ(with_token(unbound, user, 0x77), 1) << "a token that is bound to nothing answers no challenge";
}

TEST_F(CheckAuthTest, TheFirstMismatchIsTheOneThatIsTold) {
  EXPECT_EQ(with_token(good, stranger, 0x99, 4), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("User id mismatch"));
  EXPECT_EQ(with_token(good, user, 0x99, 4), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("Auth type mismatch"));
}

TEST_F(CheckAuthTest, WithATokenItsAgeDoesNotMatter) {
  token_fields old = good;
  old.timestamp = 0;
  EXPECT_EQ(with_token(old, user), 0);
}

TEST_F(CheckAuthTest, WithoutTokenAndTimeoutNobodyIsAuthenticated) {
  ASSERT_EQ(with_token(good, user), 0);
  ta.clear_trace();
  EXPECT_EQ(check_auth(user, 0, nullptr, nullptr, number_param(KM_TAG_USER_AUTH_TYPE, password)), 1);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(CheckAuthTest, WithATimeoutAPresentedTokenCountsForAWhile) {
  EXPECT_EQ(with_timeout(10), 1) << "none was presented";
  ASSERT_EQ(with_token(good, user), 0);
  EXPECT_EQ(with_timeout(10), 0);
  EXPECT_EQ(with_timeout(10, finger), 0);
  EXPECT_EQ(with_timeout(10, stranger), 1);
  EXPECT_EQ(with_timeout(10, user, 4), 1);
  device.clock.advance(9'999);
  EXPECT_EQ(with_timeout(10), 0);
  device.clock.advance(1);
  EXPECT_EQ(with_timeout(10), 1);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(CheckAuthTest, ATokenIsKeptBeforeItIsCompared) {
  EXPECT_EQ(with_token(good, stranger), 1);
  EXPECT_EQ(with_timeout(10), 0) << "it serves its own user afterwards";
}

TEST_F(CheckAuthTest, ATokenThatDoesNotMatchIsNotReplacedByAKeptOne) {
  ASSERT_EQ(with_token(good, user), 0);
  token_fields other = good;
  other.user_id = stranger;
  other.authenticator_id = stranger;
  EXPECT_EQ(with_token(other, user), 1);
}

}  // namespace
