// The counter of a device that loses its power: whatever was told once is never told again.
#include <fcntl.h>
#include <fmt/format.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "soter/soter_counter.h"
#include "tests/support/device_fixture.h"
#include "tests/support/ta_scope.h"
#include "tests/tee/crash.h"

using namespace keymaster;

namespace testing_support {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using values = std::vector<std::uint64_t>;

constexpr int increments = 3;
/// A creation and each increment touch the storage in so many steps.
constexpr int steps_of_a_change = 3;

class CounterCrashTest : public ::testing::Test {
 protected:
  CounterCrashTest() { options_.state = folder_.path() / "state"; }

  /// Starts the device and has the counter told `count` times. Each value is written to `told_` before the next is
  /// asked for, as a client keeps it.
  void tell(int count, const hosted_tee::testing::step_action& at_step = {}) const {
    const auto world = hosted_tee::secure_world::open(options_);
    const ta_scope ta(world->device());
    if (at_step) world->faults().at_storage_step(at_step);
    for (int i = 0; i < count; ++i) {
      std::uint64_t counter = 0;
      if (increase_and_get_counter(&counter) != TEE_SUCCESS) continue;
      std::ofstream(told_, std::ios::app) << counter << std::endl;
    }
  }
  [[nodiscard]] bool killed_at(int step) const {
    return hosted_tee::testing::dies_at(
        step, [&](const hosted_tee::testing::step_action& at_step) { tell(increments, at_step); });
  }
  [[nodiscard]] values told() const {
    values all;
    std::ifstream file(told_);
    for (std::uint64_t value = 0; file >> value;) all.push_back(value);
    return all;
  }
  void forget_everything() const {
    fs::remove_all(options_.state);
    fs::remove(told_);
  }
  static void expect_strictly_growing(const values& all) {
    EXPECT_EQ(std::ranges::adjacent_find(all, std::greater_equal<>()), all.end()) << ::testing::PrintToString(all);
  }

  temporary_folder folder_;
  hosted_tee::world_options options_;
  fs::path told_ = folder_.path() / "told";
};

TEST_F(CounterCrashTest, GoesOnAfterARestart) {
  tell(2);
  tell(1);
  tell(2);
  EXPECT_THAT(told(), ElementsAre(1, 2, 3, 4, 5));
}

TEST_F(CounterCrashTest, OfAFreshDeviceNeverRepeatsAValueWhereverTheDeviceDies) {
  int step = 0;
  for (bool died = true; died; ++step) {
    forget_everything();
    died = killed_at(step);
    const std::size_t before = told().size();
    EXPECT_EQ(before == increments, !died);
    tell(2);
    SCOPED_TRACE(fmt::format("step {}", step));
    EXPECT_EQ(told().size(), before + 2) << "the device works after it";
    expect_strictly_growing(told());
    // A step costs one value at most: that which was stored and could not be told.
    EXPECT_LE(told().back(), before + 3);
  }
  EXPECT_EQ(step - 1, steps_of_a_change * (1 + increments));
}

TEST_F(CounterCrashTest, OfADeviceThatDiesAgainAndAgainOnlyGrows) {
  tell(1);
  int deaths = 0;
  for (int step = 0; step < steps_of_a_change * increments; ++step) deaths += killed_at(step) ? 1 : 0;
  EXPECT_EQ(deaths, steps_of_a_change * increments);
  const std::size_t before = told().size();
  EXPECT_GE(before, 1U + 3 * (0 + 1 + 2));
  tell(1);
  EXPECT_EQ(told().size(), before + 1);
  expect_strictly_growing(told());
}

TEST_F(CounterCrashTest, IsStoredBeforeItIsTold) {
  tell(4);
  EXPECT_TRUE(hosted_tee::testing::dies_at(0, [&](const hosted_tee::testing::step_action& at_step) {
    tell(1);
    at_step("told");
  }));
  const auto stored = hosted_tee::secure_world::open(options_)->read_object(keymaster_ta, TEE_STORAGE_PRIVATE,
                                                                            {"SOTER_COUNTER_OBJECT", 21});
  EXPECT_EQ(stored, std::string("\5\0\0\0\0\0\0\0", 8));
  EXPECT_THAT(told(), ElementsAre(1, 2, 3, 4, 5));
}

TEST_F(CounterCrashTest, NeverRepeatsAValueWhateverFailsInThePlatform) {
  for (const bool fresh : {true, false}) {
    for (std::uint32_t n = 1; n < 20; ++n) {
      forget_everything();
      if (!fresh) tell(1);
      {
        const auto world = hosted_tee::secure_world::open(options_);
        const ta_scope ta(world->device());
        world->faults().fail_any_call(n, TEE_ERROR_GENERIC);
        std::uint64_t counter = 99;
        const TEE_Result result = increase_and_get_counter(&counter);
        if (!world->faults().triggered()) {
          EXPECT_EQ(n, fresh ? 6U : 5U) << "open, create, read, seek and write can fail";
          EXPECT_EQ(counter, fresh ? 1U : 2U);
          break;
        }
        EXPECT_NE(result, TEE_SUCCESS);
        EXPECT_EQ(counter, 0U);
        expect_same(ta.holdings(), {});
      }
      tell(2);
      expect_strictly_growing(told());
      EXPECT_EQ(told().size(), fresh ? 2U : 3U);
      EXPECT_EQ(told().back(), told().size()) << "what was never stored costs no value";
    }
  }
}

}  // namespace
}  // namespace testing_support
