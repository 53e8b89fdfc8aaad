// Wrong passwords cost time, more with each, and nothing gets around it.
#include <fmt/format.h>

#include "tests/companions/authenticator/authenticator_fixture.h"

using namespace keymaster::authenticator;

namespace testing_support {
namespace {

constexpr std::uint32_t one_day = 86'400'000;

class BackOffTest : public AuthenticatorTest {
 protected:
  BackOffTest() { must_verify(alice, handle, right); }  // so that everything is drawn that the device draws once

  const bytes handle = must_enrol(alice, right).output;
};

TEST_F(BackOffTest, FiveFailuresBringTheFirstWait) {
  for (int i = 0; i < 5; ++i) expect_denied(alice, handle, wrong);
  expect_busy(alice, handle, wrong, 30'000);
  EXPECT_EQ(failures(alice).count, 5U);
}

TEST_F(BackOffTest, TheRightPasswordMustWaitToo) {
  fail(alice, handle, 5);
  expect_busy(alice, handle, right, 30'000);
  expect_busy(alice, bytes(61), right, 30'000);
  expect_busy(alice, {}, {}, 30'000);
}

TEST_F(BackOffTest, TheWaitEndsToTheMillisecond) {
  fail(alice, handle, 5);
  advance(1);
  expect_busy(alice, handle, right, 29'999);
  advance(29'998);
  expect_busy(alice, handle, right, 1);
  advance(1);
  must_verify(alice, handle, right);
  EXPECT_EQ(failures(alice), record{});
}

TEST_F(BackOffTest, BeingEarlyDoesNotProlongTheWait) {
  fail(alice, handle, 5);
  for (std::uint32_t left = 30'000; left > 0; left -= 5'000) {
    expect_busy(alice, handle, wrong, left);
    advance(5'000);
  }
  must_verify(alice, handle, right);
}

TEST_F(BackOffTest, EachFailureDoublesTheWaitUpToADay) {
  fail(alice, handle, 5);
  const std::uint32_t waits[] = {30'000,    60'000,     120'000,    240'000,    480'000, 960'000, 1'920'000, 3'840'000,
                                 7'680'000, 15'360'000, 30'720'000, 61'440'000, one_day, one_day, one_day};
  for (std::uint32_t failed = 5; const std::uint32_t wait : waits) {
    SCOPED_TRACE(failed);
    expect_busy(alice, handle, right, wait);
    advance(wait - 1);
    expect_busy(alice, handle, right, 1);
    advance(1);
    expect_denied(alice, handle, wrong);
    EXPECT_EQ(failures(alice).count, ++failed);
  }
  advance(one_day);
  must_verify(alice, handle, right);
}

TEST_F(BackOffTest, TheWaitStaysADayHoweverManyFailuresThereWere) {
  for (const std::uint32_t count : {17U, 20U, 21U, 22U, 36U, 37U, 68U, 69U, 0x80000005U, 0xFFFFFFFFU}) {
    SCOPED_TRACE(count);
    set_failures(alice, {count, now_ms()});
    expect_busy(alice, handle, right, one_day);
  }
}

TEST_F(BackOffTest, TheCountDoesNotBeginAnewWhenItIsFull) {
  set_failures(alice, {0xFFFFFFFF, now_ms()});
  advance(one_day);
  EXPECT_EQ(verify(alice, handle, wrong).result, TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(failures(alice), (record{0xFFFFFFFF, now_ms()}));
  expect_busy(alice, handle, right, one_day);
}

TEST_F(BackOffTest, EachUserWaitsForTheirOwnFailures) {
  const bytes of_bob = must_enrol(bob, wrong).output;
  fail(alice, handle, 5);
  must_verify(bob, of_bob, wrong);
  expect_busy(alice, handle, right, 30'000);
}

TEST_F(BackOffTest, FailuresOutliveTheSession) {
  fail(alice, handle, 5);
  open_session();
  expect_busy(alice, handle, right, 30'000);
}

TEST_F(BackOffTest, FailuresOutliveARestartAndTheWaitBeginsAnew) {
  fail(alice, handle, 5);  // at the time at which the clock starts
  advance(20'000);
  fail(bob, handle, 5);  // later than the clock will read
  restart();
  const record of_alice = failures(alice);
  expect_busy(alice, handle, right, 30'000);
  EXPECT_EQ(failures(alice), of_alice);
  EXPECT_EQ(verify(bob, handle, right).a, 30'000U);
  EXPECT_EQ(failures(bob), (record{5, now_ms()}));
  advance(29'999);
  expect_busy(bob, handle, right, 1);
  advance(1);
  expect_denied(bob, handle, right);
}

TEST_F(BackOffTest, ATimeInTheFutureCountsAsNowAndIsWrittenDown) {
  for (const std::uint64_t ahead : {std::uint64_t{1}, std::uint64_t{one_day} * 400, ~std::uint64_t{0} / 2}) {
    SCOPED_TRACE(ahead);
    set_failures(alice, {7, now_ms() + ahead});
    EXPECT_EQ(verify(alice, handle, right).a, 120'000U);
    EXPECT_EQ(failures(alice), (record{7, now_ms()}));
    advance(1);
    expect_busy(alice, handle, right, 119'999);
  }
}

TEST_F(BackOffTest, AFutureTimeThatCannotBeRewrittenLetsNobodyTry) {
  set_failures(alice, {5, now_ms() + 1});
  faults().fail_call("TEE_CreatePersistentObject", 1, TEE_ERROR_STORAGE_NO_SPACE);
  expect_refused(TEE_ERROR_STORAGE_NO_SPACE, {"Write stored object failed with 0xffff3041\n"}, [&] {
    const password_answer got = verify(alice, handle, right);
    EXPECT_EQ(got.a, 0U);
    return got.result;
  });
}

TEST_F(BackOffTest, ARecordThatIsNoneLetsNobodyTry) {
  for (const std::size_t size : {0U, 4U, 11U, 13U}) {
    store("pwauth.fail.1000", bytes(size));
    expect_refused(TEE_ERROR_BAD_STATE, {fmt::format("A stored object has {} bytes or more instead of 12\n", size)},
                   [&] { return verify(alice, handle, right).result; });
  }
}

}  // namespace
}  // namespace testing_support
