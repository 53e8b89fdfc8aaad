// Begin: how often a key may be used, and how soon again.
#include "auth/use_log.h"
#include "tests/auth/authorize_begin_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::IsEmpty;

namespace {

class AuthorizeBeginUsesTest : public AuthorizeBeginTest {
 protected:
  /// Where the wall clock and the system clock agree, so that the rate limit shows.
  void SetUp() override {
    AuthorizeBeginTest::SetUp();
    restart({7200, 0}, {7200, 0});
    ta.clear_trace();
  }

  static param_list counted(std::uint32_t limit) { return key_of().add(KM_TAG_MAX_USES_PER_BOOT, limit); }
  static param_list rated(std::uint32_t seconds) { return key_of().add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, seconds); }

  void expect_used_up(const begin_answer& answer) {
    expect_refused(answer, KM_ERROR_KEY_MAX_OPS_EXCEEDED, {"Key max ops exceeded"});
  }
  void expect_too_soon(const begin_answer& answer) {
    expect_refused(answer, KM_ERROR_KEY_RATE_LIMIT_EXCEEDED, {"key rate limit exceeded"});
  }
  static bool is_known(const bytes& of_key) {
    std::uint32_t seconds = 0;
    return use_log_last_use(of_key, &seconds);
  }
  void fill_the_log() {
    for (std::uint32_t i = 0; i < 8; ++i) expect_granted(begin_blob(pattern(120, 50 + i), counted(100)));
  }
};

TEST_F(AuthorizeBeginUsesTest, AKeyIsUsedAsOftenAsItsLimitSays) {
  expect_granted(begin(counted(2)));
  expect_granted(begin(counted(2)));
  expect_used_up(begin(counted(2)));
  expect_used_up(begin(counted(2)));
  expect_granted(begin_blob(pattern(150, 2), counted(2)));
}

TEST_F(AuthorizeBeginUsesTest, ALimitOfZeroAllowsOneUse) {
  expect_granted(begin(counted(0)));
  expect_used_up(begin(counted(0)));
}

TEST_F(AuthorizeBeginUsesTest, ANinthKeyWithALimitFindsNoRoom) {
  fill_the_log();
  expect_refused(begin(counted(5)), KM_ERROR_TOO_MANY_OPERATIONS, {"Too many use log"});
  expect_granted(begin(key_of()));
}

TEST_F(AuthorizeBeginUsesTest, ARefusalForAnotherReasonHasUsedUpACount) {
  for (int i = 0; i < 2; ++i) {
    expect_refused(begin(counted(2).remove(KM_TAG_PURPOSE)), KM_ERROR_INCOMPATIBLE_PURPOSE,
                   {"No such purpose in key_params"});
  }
  expect_used_up(begin(counted(2)));
}

TEST_F(AuthorizeBeginUsesTest, ARefusalBeforeTheLimitInTheKeysOrderUsesUpNone) {
  const param_list key = key_of().add(KM_TAG_BOOTLOADER_ONLY).add(KM_TAG_MAX_USES_PER_BOOT, 1);
  for (int i = 0; i < 3; ++i) expect_refused(begin(key), KM_ERROR_INVALID_KEY_BLOB, {"Bootloader only key"});
  expect_granted(begin(counted(1)));
}

TEST_F(AuthorizeBeginUsesTest, ALimitThatStandsTwiceCountsTwice) {
  const param_list twice = counted(3).add(KM_TAG_MAX_USES_PER_BOOT, 3);
  expect_granted(begin(twice));
  expect_used_up(begin(twice));
}

TEST_F(AuthorizeBeginUsesTest, PublicKeyOperationsAreNotCounted) {
  const param_list key = key_of(KM_ALGORITHM_RSA).add(KM_TAG_MAX_USES_PER_BOOT, 1);
  for (int i = 0; i < 3; ++i) expect_granted(begin(key, KM_PURPOSE_VERIFY));
  EXPECT_FALSE(is_known(blob));
  expect_granted(begin(key, KM_PURPOSE_SIGN));
  expect_used_up(begin(key, KM_PURPOSE_SIGN));
}

TEST_F(AuthorizeBeginUsesTest, ASecondUseMustComeLaterThanTheLimit) {
  expect_granted(begin(rated(10)));
  expect_too_soon(begin(rated(10)));
  device.clock.advance(10'999);
  expect_too_soon(begin(rated(10)));
  device.clock.advance(1);
  expect_granted(begin(rated(10)));
  expect_too_soon(begin(rated(10)));
}

TEST_F(AuthorizeBeginUsesTest, ALimitOfZeroSecondsStillAsksForAnotherSecond) {
  expect_granted(begin(rated(0)));
  device.clock.advance(999);
  expect_too_soon(begin(rated(0)));
  device.clock.advance(1);
  expect_granted(begin(rated(0)));
}

TEST_F(AuthorizeBeginUsesTest, ARefusedUseIsNotRecorded) {
  expect_granted(begin(rated(10)));
  device.clock.advance(8'000);
  expect_too_soon(begin(rated(10)));
  device.clock.advance(3'000);
  expect_granted(begin(rated(10)));
}

TEST_F(AuthorizeBeginUsesTest, AWallClockFarAheadNeverFindsAUseTooSoon) {
  // The last use is kept in system time and compared with the wall clock: keys in the field rely on it.
  restart({7200, 0}, {1'700'000'000, 0});
  for (int i = 0; i < 3; ++i) expect_granted(begin(rated(1'000'000)));
  std::uint32_t seconds = 0;
  ASSERT_TRUE(use_log_last_use(blob, &seconds));
  EXPECT_EQ(seconds, 7200U);
}

TEST_F(AuthorizeBeginUsesTest, AWallClockBehindTheSystemClockWrapsToLongAgo) {
  restart({7200, 0}, {7100, 0});
  expect_granted(begin(rated(1'000'000)));
  expect_granted(begin(rated(1'000'000)));
  expect_granted(begin(rated(0xFFFFFF9B)));  // 7100 - 7200 is 2^32 - 100
  expect_too_soon(begin(rated(0xFFFFFF9C)));
}

TEST_F(AuthorizeBeginUsesTest, AUseIsRecordedOnlyWhenEverythingElsePassed) {
  expect_refused(begin(rated(10).remove(KM_TAG_PURPOSE)), KM_ERROR_INCOMPATIBLE_PURPOSE,
                 {"No such purpose in key_params"});
  expect_refused(begin(rated(10), KM_PURPOSE_ENCRYPT, param_list{}.add_blob(KM_TAG_NONCE, pattern(12))),
                 KM_ERROR_CALLER_NONCE_PROHIBITED, {"Caller nonce prohibited"});
  EXPECT_FALSE(is_known(blob));
  expect_granted(begin(rated(10)));
  EXPECT_TRUE(is_known(blob));
}

TEST_F(AuthorizeBeginUsesTest, AKeyThatNeedsATokenPerOperationIsNotRecorded) {
  const param_list key = rated(10).add(KM_TAG_USER_SECURE_ID, 5).add(KM_TAG_USER_AUTH_TYPE, 1);
  for (int i = 0; i < 2; ++i) expect_refused(begin(key), KM_OP_AUTH_NEEDED, {"OP AUTH NEEDED"});
  EXPECT_FALSE(is_known(blob));
}

TEST_F(AuthorizeBeginUsesTest, AFullLogLetsAUsePassUnrecorded) {
  fill_the_log();
  for (int i = 0; i < 2; ++i) expect_granted(begin(rated(10)));
  EXPECT_FALSE(is_known(blob));
}

TEST_F(AuthorizeBeginUsesTest, AnEntryWhoseIntervalIsOverMakesRoom) {
  for (std::uint32_t i = 0; i < 8; ++i) expect_granted(begin_blob(pattern(120, 50 + i), rated(10)));
  device.clock.advance(10'000);
  expect_refused(begin(counted(5)), KM_ERROR_TOO_MANY_OPERATIONS, {"Too many use log"});
  device.clock.advance(1'000);
  expect_granted(begin(counted(5)));
}

TEST_F(AuthorizeBeginUsesTest, ACountAndARateShareAnEntry) {
  const param_list key = counted(2).add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 10);
  expect_granted(begin(key));
  expect_too_soon(begin(key));  // which has used up the second count
  device.clock.advance(11'000);
  expect_used_up(begin(key));
}

TEST_F(AuthorizeBeginUsesTest, ACountThatWasJustTakenHasNoLastUseYet) {
  // The count stands first in the key and makes the entry, whose last use is second 0 of the system.
  const param_list key = counted(5).add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 7200);
  expect_too_soon(begin(key));
  expect_granted(begin_blob(pattern(150, 3), counted(5).add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 7199)));
}

TEST_F(AuthorizeBeginUsesTest, LongBlobsAreLimitedToo) {
  const bytes rsa_4096 = pattern(2736, 9);
  expect_granted(begin_blob(rsa_4096, counted(1)));
  expect_used_up(begin_blob(rsa_4096, counted(1)));
}

}  // namespace
