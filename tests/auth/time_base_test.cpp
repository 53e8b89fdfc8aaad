// The TA's wall clock: the normal world's time at the start, carried on by the system clock.
#include "auth/time_base.h"

#include <random>

#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;

namespace {

class TimeBaseTest : public TaUnitTest {
 protected:
  void start(TEE_Time system, TEE_Time ree) {
    device.clock.set_system(system);
    device.clock.set_ree(ree);
    time_base_init();
  }

  void expect_now(TEE_Time system, TEE_Time expected) {
    device.clock.set_system(system);
    const TEE_Time now = time_base_now();
    EXPECT_EQ(now.seconds, expected.seconds);
    EXPECT_EQ(now.millis, expected.millis);
    EXPECT_EQ(time_base_now_ms(), std::uint64_t{expected.seconds} * 1000 + expected.millis);
  }
};

TEST_F(TimeBaseTest, AtTheStartItIsTheNormalWorldsTime) {
  start({7200, 250}, {1'700'000'000, 500});
  expect_now({7200, 250}, {1'700'000'000, 500});
}

TEST_F(TimeBaseTest, ItGoesOnWithTheSystemClock) {
  start({7200, 250}, {1'700'000'000, 500});
  expect_now({7200, 251}, {1'700'000'000, 501});
  expect_now({7200, 749}, {1'700'000'000, 999});
  expect_now({7200, 750}, {1'700'000'001, 0});
  expect_now({7201, 0}, {1'700'000'001, 250});
  expect_now({7201, 100}, {1'700'000'001, 350});
  expect_now({10800, 250}, {1'700'003'600, 500});
}

TEST_F(TimeBaseTest, TheNormalWorldCannotMoveItAfterTheStart) {
  start({7200, 250}, {1'700'000'000, 500});
  device.clock.set_ree({1'000'000'000, 0});
  expect_now({7200, 250}, {1'700'000'000, 500});
}

TEST_F(TimeBaseTest, MillisecondsBelowAndAboveThoseOfTheStartAreCarried) {
  start({100, 999}, {1000, 0});
  expect_now({100, 999}, {1000, 0});
  expect_now({101, 0}, {1000, 1});
  expect_now({101, 998}, {1000, 999});
  expect_now({101, 999}, {1001, 0});
  start({100, 0}, {1000, 999});
  expect_now({100, 999}, {1001, 998});
  expect_now({101, 0}, {1001, 999});
}

TEST_F(TimeBaseTest, ATimeAtTheEdgesOf32BitsDoesNotSlip) {
  start({5, 0}, {0, 0});
  expect_now({5, 0}, {0, 0});
  expect_now({5, 999}, {0, 999});
  expect_now({6, 0}, {1, 0});
  start({0, 500}, {0xFFFFFFFE, 0});
  expect_now({1, 499}, {0xFFFFFFFE, 999});
  expect_now({1, 500}, {0xFFFFFFFF, 0});
}

TEST_F(TimeBaseTest, MillisecondsSince1970NeedMoreThan32Bits) {
  start({7200, 0}, {4'000'000'000, 123});
  device.clock.set_system({7201, 1});
  EXPECT_EQ(time_base_now_ms(), 4'000'000'001'124U);
}

TEST_F(TimeBaseTest, AnyPairOfClocksAddsUp) {
  std::mt19937 random(5);
  const auto below = [&](std::uint32_t limit) { return static_cast<std::uint32_t>(random() % limit); };
  for (int round = 0; round < 2000; ++round) {
    const TEE_Time system = {below(1'000'000), below(1000)}, ree = {below(2'000'000'000), below(1000)};
    const std::uint64_t elapsed = below(1'000'000'000);
    start(system, ree);
    const std::uint64_t system_ms = std::uint64_t{system.seconds} * 1000 + system.millis + elapsed;
    device.clock.set_system(
        {static_cast<std::uint32_t>(system_ms / 1000), static_cast<std::uint32_t>(system_ms % 1000)});
    ASSERT_EQ(time_base_now_ms(), std::uint64_t{ree.seconds} * 1000 + ree.millis + elapsed);
  }
}

}  // namespace
