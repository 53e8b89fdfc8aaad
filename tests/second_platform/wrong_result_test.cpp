// A platform that answers what it should not: success although nothing was done, and results that no standard knows. A
// command may then fail or, in the first case, go on with what there is; it keeps within its memory, gives back all
// that it took, and takes no failure for success.
#include <fmt/format.h>

#include <algorithm>
#include <set>

#include "tests/second_platform/scenario.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::IsEmpty;

namespace second_platform {
namespace {

/// The functions without a result. All others are made to lie.
const std::set<std::string> without_result = {
    "TEE_FreeTransientObject", "TEE_FreeOperation",  "TEE_CloseObject",   "TEE_CloseTASession",
    "TEE_DigestUpdate",        "TEE_CipherInit",     "TEE_MACInit",       "TEE_MACUpdate",
    "TEE_AEUpdateAAD",         "TEE_GenerateRandom", "TEE_GetSystemTime", "TEE_GetREETime"};

class WrongResultTest : public ::testing::Test {
 protected:
  command_answer run(const scenario& tested, const std::string& function, std::uint32_t nth, const twist& departure) {
    power_on();
    EXPECT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
    const bytes blob = tested.prepare(keymaster_ta);
    const std::uint32_t handle = tested.begin(keymaster_ta, blob);
    platform.clear();
    if (!function.empty()) platform.answer(function, nth, departure);
    command_answer answer = tested.command(keymaster_ta, blob, handle);
    calls_ = platform.names();
    platform.no_more_departures();
    if (handle != 0) (void)keymaster_ta.abort(handle);
    TA_DestroyEntryPoint();
    EXPECT_EQ(platform.held(), (holdings{0, 2, 0, 0}));
    EXPECT_THAT(platform.violations(), IsEmpty());
    return answer;
  }

  /// Runs every scenario with every call of it departing, and hands what came of it to `judge`.
  template <class Judge>
  void sweep(const twist& departure, Judge&& judge) {
    for (const scenario& tested : scenarios()) {
      EXPECT_EQ(run(tested, "", 0, {}), outcome{}) << tested.name;
      const std::vector<std::string> honest = calls_;
      std::map<std::string, std::uint32_t> counts;
      for (const std::string& function : honest) {
        if (without_result.contains(function)) continue;
        const std::uint32_t nth = ++counts[function];
        SCOPED_TRACE(fmt::format("{}: {} no. {}", tested.name, function, nth));
        judge(tested.name, function, run(tested, function, nth, departure));
      }
    }
  }

  ta keymaster_ta;
  std::vector<std::string> calls_;
};

TEST_F(WrongResultTest, SuccessWithNothingDoneLeavesNothingBehindAndTouchesNothingElse) {
  twist nothing_done;
  nothing_done.result = TEE_SUCCESS;
  nothing_done.undone = true;
  std::size_t runs = 0;
  sweep(nothing_done, [&](const std::string&, const std::string&, const outcome&) { ++runs; });
  EXPECT_GT(runs, 500U);
}

/// Where a failure of the platform is no failure of the command: the tag's judge knows one bad answer, and a counter
/// that cannot be made is looked for once more.
bool passes_over(const std::string& name, const std::string& function) {
  if (function == "TEE_AEDecryptFinal") return name == "finish aes gcm decrypt";
  return function == "TEE_CreatePersistentObject";
}

TEST_F(WrongResultTest, ResultsThatNobodyKnowsAreFailures) {
  for (const TEE_Result strange : {TEE_Result{1}, TEE_Result{0x12345678}, TEE_ERROR_TARGET_DEAD}) {
    twist departure;
    departure.result = strange;
    departure.undone = true;
    sweep(departure, [&](const std::string& name, const std::string& function, const outcome& answer) {
      if (passes_over(name, function)) return;
      EXPECT_NE(answer, outcome{}) << fmt::format("result {:#x}", strange);
    });
  }
}

TEST_F(WrongResultTest, AStartThatTheProbeOfTheStorageFailsInAnyWayGoesOnWithoutIt) {
  for (const TEE_Result strange : {TEE_Result{1}, TEE_ERROR_GENERIC, TEE_ERROR_OUT_OF_MEMORY}) {
    power_on();
    twist departure;
    departure.result = strange;
    platform.answer("TEE_RPMB_MakeFileSystem", 1, departure);
    EXPECT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
    EXPECT_EQ(platform.errors().at(0), fmt::format("judge_rpmb: TEE_RPMB_MakeFileSystem return {:#010x}", strange));
    TA_DestroyEntryPoint();
    EXPECT_EQ(platform.held(), (holdings{0, 1, 0, 0}));
  }
}

TEST_F(WrongResultTest, EveryStepOfTheStartThatFailsFailsItAndLeavesNothing) {
  power_on();
  ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
  const std::vector<std::string> honest = platform.names();
  TA_DestroyEntryPoint();
  std::map<std::string, std::uint32_t> counts;
  for (const std::string& function : honest) {
    if (without_result.contains(function) || function == "TEE_RPMB_MakeFileSystem") continue;
    const std::uint32_t nth = ++counts[function];
    SCOPED_TRACE(fmt::format("{} no. {}", function, nth));
    power_on();
    twist departure;
    departure.result = 0x12345678;
    departure.undone = true;
    platform.answer(function, nth, departure);
    EXPECT_EQ(TA_CreateEntryPoint(), TEE_Result{0x12345678});
    EXPECT_EQ(platform.held(), holdings{});
    EXPECT_THAT(platform.violations(), IsEmpty());
  }
}

TEST_F(WrongResultTest, ASessionOpensAndClosesWithoutAnyCall) {
  power_on();
  ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
  platform.clear();
  TEE_Param params[4] = {};
  void* context = nullptr;
  EXPECT_EQ(TA_OpenSessionEntryPoint(0, params, &context), TEE_SUCCESS);
  TA_CloseSessionEntryPoint(context);
  EXPECT_THAT(platform.calls(), IsEmpty());
  EXPECT_EQ(platform.heap_calls(), 0U);
  TA_DestroyEntryPoint();
}

}  // namespace
}  // namespace second_platform
