// How often and when keys were used: eight entries, each known by its whole blob.
#include "auth/use_log.h"

#include "tests/auth/auth_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

constexpr std::uint32_t log_size = 8;
constexpr std::uint32_t forever = 0xFFFFFFFF;

class UseLogTest : public AuthTest {
 protected:
  /// The error of one more counted use; KM_ERROR_OK when it is granted.
  static keymaster_error_t use(const bytes& blob, std::uint32_t limit) {
    keymaster_error_t error = KM_ERROR_OK;
    const int refused = check_use_count_and_add(blob, limit, &error);
    EXPECT_EQ(refused, error == KM_ERROR_OK ? 0 : 1);
    return error;
  }

  static bool is_known(const bytes& blob) {
    std::uint32_t seconds = 0;
    return use_log_last_use(blob, &seconds);
  }
  static std::uint32_t last_use(const bytes& blob) {
    std::uint32_t seconds = 0xDEADBEEF;
    EXPECT_TRUE(use_log_last_use(blob, &seconds));
    return seconds;
  }

  /// Eight keys with one counted use each.
  static void fill_with_counts() {
    for (std::uint32_t i = 0; i < log_size; ++i) EXPECT_EQ(use(pattern(200, i), 5), KM_ERROR_OK);
  }
  void at(std::uint32_t seconds) { device.clock.set_system({seconds, 0}); }
};

TEST_F(UseLogTest, AKeyIsUsedAsOftenAsItsLimitSays) {
  const bytes blob = pattern(300);
  for (int i = 0; i < 3; ++i) EXPECT_EQ(use(blob, 3), KM_ERROR_OK);
  EXPECT_THAT(ta.errors(), IsEmpty());
  for (int i = 0; i < 3; ++i) EXPECT_EQ(use(blob, 3), KM_ERROR_KEY_MAX_OPS_EXCEEDED);
  EXPECT_THAT(ta.errors(), ElementsAre("Key max ops exceeded", "Key max ops exceeded", "Key max ops exceeded"));
  EXPECT_EQ(use(blob, 4), KM_ERROR_OK) << "refusals do not count as uses";
}

TEST_F(UseLogTest, ALimitOfZeroAllowsOneUse) {
  EXPECT_EQ(use(pattern(300), 0), KM_ERROR_OK);
  EXPECT_EQ(use(pattern(300), 0), KM_ERROR_KEY_MAX_OPS_EXCEEDED);
}

TEST_F(UseLogTest, ANinthKeyFindsNoRoomWhileEightAreCounted) {
  fill_with_counts();
  EXPECT_EQ(use(pattern(200, 99), 5), KM_ERROR_TOO_MANY_OPERATIONS);
  EXPECT_THAT(ta.errors(), ElementsAre("Too many use log"));
  at(forever);
  EXPECT_EQ(use(pattern(200, 99), 5), KM_ERROR_TOO_MANY_OPERATIONS) << "a count never runs out";
  for (std::uint32_t i = 0; i < log_size; ++i) EXPECT_EQ(use(pattern(200, i), 5), KM_ERROR_OK);
}

TEST_F(UseLogTest, AKeyIsKnownByAllOfItsBlob) {
  const bytes blob = pattern(300);
  ASSERT_EQ(use(blob, 1), KM_ERROR_OK);
  EXPECT_TRUE(is_known(blob));
  for (const std::size_t place : {0U, 1U, 93U, 299U}) EXPECT_FALSE(is_known(flip(blob, place))) << place;
  EXPECT_FALSE(is_known({blob.begin(), blob.end() - 1}));
  EXPECT_FALSE(is_known(join({blob, bytes{0}})));
  EXPECT_FALSE(is_known({}));
}

TEST_F(UseLogTest, ALongBlobIsKnownByItsLengthAndFirst2048Bytes) {
  for (const std::size_t size : {2048U, 2049U, 3000U, 20000U}) {
    const bytes blob = pattern(size, static_cast<std::uint32_t>(size));
    ASSERT_EQ(use(blob, 1), KM_ERROR_OK) << size;
    EXPECT_EQ(use(blob, 1), KM_ERROR_KEY_MAX_OPS_EXCEEDED) << size;
    EXPECT_FALSE(is_known(flip(blob, 2047))) << size;
    EXPECT_FALSE(is_known(join({blob, bytes{0}}))) << size;
    if (size > 2048) {
      EXPECT_TRUE(is_known(flip(blob, 2048))) << size;
      EXPECT_FALSE(is_known({blob.begin(), blob.begin() + 2048})) << size;
    }
  }
}

TEST_F(UseLogTest, EightLongBlobsStayInTheirEntries) {
  for (std::uint32_t i = 0; i < log_size; ++i) ASSERT_EQ(use(pattern(5040, i), 2), KM_ERROR_OK);
  for (std::uint32_t i = 0; i < log_size; ++i) EXPECT_EQ(use(pattern(5040, i), 2), KM_ERROR_OK);
  for (std::uint32_t i = 0; i < log_size; ++i) EXPECT_EQ(use(pattern(5040, i), 2), KM_ERROR_KEY_MAX_OPS_EXCEEDED);
}

TEST_F(UseLogTest, ACountedUseHasNoTime) {
  ASSERT_EQ(use(pattern(100), 5), KM_ERROR_OK);
  EXPECT_EQ(last_use(pattern(100)), 0U);
}

TEST_F(UseLogTest, ARecordedUseHasTheSystemTime) {
  use_log_record(pattern(100), 10);
  EXPECT_EQ(last_use(pattern(100)), 7200U);
  at(7777);
  use_log_record(pattern(100), 10);
  EXPECT_EQ(last_use(pattern(100)), 7777U);
}

TEST_F(UseLogTest, RecordingKeepsACount) {
  ASSERT_EQ(use(pattern(100), 2), KM_ERROR_OK);
  use_log_record(pattern(100), 10);
  EXPECT_EQ(use(pattern(100), 2), KM_ERROR_OK);
  EXPECT_EQ(use(pattern(100), 2), KM_ERROR_KEY_MAX_OPS_EXCEEDED);
}

TEST_F(UseLogTest, RecordingCountsNoUse) {
  use_log_record(pattern(100), 10);
  EXPECT_EQ(use(pattern(100), 1), KM_ERROR_OK);
  EXPECT_EQ(use(pattern(100), 1), KM_ERROR_KEY_MAX_OPS_EXCEEDED);
}

TEST_F(UseLogTest, AFullLogRecordsNothingAndSaysNothing) {
  fill_with_counts();
  use_log_record(pattern(200, 99), 10);
  EXPECT_FALSE(is_known(pattern(200, 99)));
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(UseLogTest, AnEntryWithoutACountIsFreeOnceItsIntervalIsOver) {
  for (std::uint32_t i = 0; i < log_size; ++i) use_log_record(pattern(200, i), 100);
  at(7300);
  EXPECT_EQ(use(pattern(200, 99), 5), KM_ERROR_TOO_MANY_OPERATIONS) << "the second in which it ends";
  at(7301);
  EXPECT_EQ(use(pattern(200, 99), 5), KM_ERROR_OK);
  EXPECT_FALSE(is_known(pattern(200, 0))) << "the first of them gave way";
  EXPECT_TRUE(is_known(pattern(200, 1)));
  EXPECT_EQ(last_use(pattern(200, 99)), 0U) << "the old times went with the old key";
}

TEST_F(UseLogTest, ARecordTakesTheFirstEntryWhoseIntervalIsOver) {
  for (std::uint32_t i = 0; i < log_size; ++i) use_log_record(pattern(200, i), i == 3 ? 10 : 1000);
  at(7211);
  use_log_record(pattern(200, 99), 10);
  EXPECT_EQ(last_use(pattern(200, 99)), 7211U);
  EXPECT_FALSE(is_known(pattern(200, 3)));
}

TEST_F(UseLogTest, AnEntryWithACountStaysWhenItsIntervalIsOver) {
  for (std::uint32_t i = 0; i < log_size; ++i) {
    ASSERT_EQ(use(pattern(200, i), 5), KM_ERROR_OK);
    use_log_record(pattern(200, i), 1);
  }
  at(forever);
  EXPECT_EQ(use(pattern(200, 99), 5), KM_ERROR_TOO_MANY_OPERATIONS);
}

TEST_F(UseLogTest, AnIntervalBeyond32BitsEndsAtTheirEnd) {
  for (std::uint32_t i = 0; i < log_size; ++i) use_log_record(pattern(200, i), forever);
  at(7201);
  EXPECT_EQ(use(pattern(200, 99), 5), KM_ERROR_TOO_MANY_OPERATIONS) << "7200 + 2^32 - 1 is 7199 modulo 2^32";
  at(forever);
  EXPECT_EQ(use(pattern(200, 99), 5), KM_ERROR_TOO_MANY_OPERATIONS);
}

TEST_F(UseLogTest, ARestartForgetsAllUses) {
  fill_with_counts();
  restart(start_system, start_ree);
  EXPECT_FALSE(is_known(pattern(200, 0)));
  fill_with_counts();
}

}  // namespace
