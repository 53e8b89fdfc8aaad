// The kept tokens: which of them still count, and which give way to others.
#include "auth/token_cache.h"

#include "tests/auth/auth_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace {

constexpr std::uint32_t password = 1, fingerprint = 2, any_type = 0xFFFFFFFF;
constexpr std::uint32_t cache_size = 16;

class TokenCacheTest : public AuthTest {
 protected:
  void store(const token_fields& fields) {
    const bytes token = mint(fields);
    token_cache_store(std::span<const std::uint8_t, auth_token_size>{token});
  }

  /// A token of `user` that is `age` milliseconds old.
  static token_fields aged(std::uint64_t user, std::uint64_t age) {
    return {.user_id = user, .type = password, .timestamp = now_ms - age};
  }
};

TEST_F(TokenCacheTest, AnEmptyCacheKnowsNobody) {
  for (const std::uint64_t id : {0ULL, 1ULL, 0xFFFFFFFFFFFFFFFFULL}) {
    EXPECT_FALSE(token_cache_has_recent(id, any_type, 0xFFFFFFFF));
  }
}

TEST_F(TokenCacheTest, ATokenIsFoundByItsUserAndByItsAuthenticator) {
  store({.user_id = 0xA1, .authenticator_id = 0xB2, .type = password, .timestamp = now_ms});
  EXPECT_TRUE(token_cache_has_recent(0xA1, password, 1));
  EXPECT_TRUE(token_cache_has_recent(0xB2, password, 1));
  EXPECT_FALSE(token_cache_has_recent(0xA2, password, 1));
  EXPECT_FALSE(token_cache_has_recent(0, password, 1));
}

TEST_F(TokenCacheTest, TheTypesMustShareABit) {
  store({.user_id = 1, .type = 0x80000002, .timestamp = now_ms});
  EXPECT_TRUE(token_cache_has_recent(1, fingerprint, 1));
  EXPECT_TRUE(token_cache_has_recent(1, password | fingerprint, 1));
  EXPECT_TRUE(token_cache_has_recent(1, 0x80000000, 1));
  EXPECT_FALSE(token_cache_has_recent(1, password, 1));
  EXPECT_FALSE(token_cache_has_recent(1, 0x00000080, 1)) << "the type is big-endian in the token";
  EXPECT_FALSE(token_cache_has_recent(1, 0, 1));
}

TEST_F(TokenCacheTest, ATokenCountsWhileItsAgeIsBelowTheTimeout) {
  store(aged(1, 9'999));
  EXPECT_TRUE(token_cache_has_recent(1, password, 10));
  EXPECT_FALSE(token_cache_has_recent(1, password, 9));
  device.clock.advance(1);
  EXPECT_FALSE(token_cache_has_recent(1, password, 10)) << "an age of exactly the timeout";
  EXPECT_TRUE(token_cache_has_recent(1, password, 11));
  EXPECT_FALSE(token_cache_has_recent(1, password, 0));
}

TEST_F(TokenCacheTest, ALongTimeoutDoesNotWrap) {
  store(aged(1, 7'000'000));
  EXPECT_TRUE(token_cache_has_recent(1, password, 4'294'968)) << "4294968 s are 704 ms modulo 2^32";
  EXPECT_TRUE(token_cache_has_recent(1, password, 0xFFFFFFFF));
  EXPECT_FALSE(token_cache_has_recent(1, password, 7'000));
}

TEST_F(TokenCacheTest, ATimeStampInTheFutureIsNotYoung) {
  store({.user_id = 1, .type = password, .timestamp = now_ms + 1});
  EXPECT_FALSE(token_cache_has_recent(1, password, 0xFFFFFFFF));
  device.clock.advance(1);
  EXPECT_TRUE(token_cache_has_recent(1, password, 1)) << "its time has come";
}

TEST_F(TokenCacheTest, OnlyTheSystemClockTellsAnAge) {
  store(aged(1, 0));
  device.clock.set_ree({4'000'000'000, 0});
  EXPECT_TRUE(token_cache_has_recent(1, password, 1));
}

TEST_F(TokenCacheTest, AnyOfSixteenTokensMayMatch) {
  for (std::uint64_t user = 1; user <= cache_size; ++user) store(aged(user, user));
  for (std::uint64_t user = 1; user <= cache_size; ++user) EXPECT_TRUE(token_cache_has_recent(user, password, 1));
}

TEST_F(TokenCacheTest, TokensOfTheFirstMomentAfterBootAllFindRoom) {
  // Their time stamp is 0, older than which nothing is: an empty entry must not count as a token of that age.
  restart({1, 0}, start_ree);
  for (std::uint64_t user = 1; user <= cache_size; ++user) store({.user_id = user, .type = password});
  for (std::uint64_t user = 1; user <= cache_size; ++user) EXPECT_TRUE(token_cache_has_recent(user, password, 2));
}

TEST_F(TokenCacheTest, TheSeventeenthTakesThePlaceOfTheOldest) {
  for (std::uint64_t user = 1; user <= cache_size; ++user) store(aged(user, user == 7 ? 900 : user));
  store(aged(100, 5000));
  EXPECT_FALSE(token_cache_has_recent(7, password, 100));
  EXPECT_TRUE(token_cache_has_recent(100, password, 100)) << "older than all others, yet just presented";
  for (std::uint64_t user = 1; user <= cache_size; ++user) {
    EXPECT_EQ(token_cache_has_recent(user, password, 100), user != 7) << user;
  }
}

TEST_F(TokenCacheTest, ATokenOfTheSameIssuerReplacesTheOlderOne) {
  for (std::uint64_t user = 1; user <= cache_size; ++user) store(aged(user, 500));
  for (std::uint64_t age = 400; age > 300; --age) store(aged(3, age));
  for (std::uint64_t user = 1; user <= cache_size; ++user) {
    EXPECT_TRUE(token_cache_has_recent(user, password, 1)) << "nobody else was evicted: " << user;
  }
  device.clock.advance(600);
  EXPECT_TRUE(token_cache_has_recent(3, password, 1));
  EXPECT_FALSE(token_cache_has_recent(4, password, 1));
}

TEST_F(TokenCacheTest, AReplayedTokenDoesNotEvictANewerOne) {
  store(aged(1, 100));
  store(aged(1, 60'000));
  EXPECT_TRUE(token_cache_has_recent(1, password, 1));
}

TEST_F(TokenCacheTest, TheSameTokenTakesOneEntryHoweverOftenItIsPresented) {
  for (std::uint64_t user = 1; user < cache_size; ++user) store(aged(user, 100));
  for (int i = 0; i < 40; ++i) store(aged(50, 10));
  for (std::uint64_t user = 1; user < cache_size; ++user) EXPECT_TRUE(token_cache_has_recent(user, password, 1));
  EXPECT_TRUE(token_cache_has_recent(50, password, 1));
}

TEST_F(TokenCacheTest, UserAuthenticatorAndTypeTogetherAreTheIssuer) {
  store({.user_id = 1, .authenticator_id = 10, .type = password, .timestamp = now_ms});
  store({.user_id = 1, .authenticator_id = 10, .type = fingerprint, .timestamp = now_ms - 2000});
  store({.user_id = 1, .authenticator_id = 11, .type = password, .timestamp = now_ms - 2000});
  store({.user_id = 2, .authenticator_id = 10, .type = password, .timestamp = now_ms - 2000});
  EXPECT_TRUE(token_cache_has_recent(1, fingerprint, 3));
  EXPECT_TRUE(token_cache_has_recent(11, password, 3));
  EXPECT_TRUE(token_cache_has_recent(2, password, 3));
  EXPECT_TRUE(token_cache_has_recent(1, password, 1));
}

TEST_F(TokenCacheTest, ARestartForgetsAllTokens) {
  store(aged(1, 0));
  restart(start_system, start_ree);
  EXPECT_FALSE(token_cache_has_recent(1, password, 100));
}

}  // namespace
