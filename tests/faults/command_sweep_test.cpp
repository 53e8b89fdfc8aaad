// Every allocation and every platform call of every scenario fails once. A command whose platform failed must fail
// itself, leave nothing behind, spoil nothing of other operations, and work again the next time.
#include <fmt/format.h>

#include <map>
#include <set>

#include "tests/faults/stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// An operation that has nothing to do with the scenario and must come through it.
class bystander {
 public:
  explicit bystander(stage& on) : on_(on) {
    const bytes blob = on.client().must_import(rsa_key(1024), on.key.material());
    handle_ = on.client().must_begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS));
  }
  void feed() {
    const bytes piece = pattern(3, static_cast<std::uint32_t>(fed_.size()));
    ASSERT_TRUE(on_.client().update(handle_, piece).ok());
    fed_.insert(fed_.end(), piece.begin(), piece.end());
  }
  void finish() {
    const finish_answer done = on_.client().finish(handle_);
    ASSERT_TRUE(done.ok());
    EXPECT_TRUE(on_.key.verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS, fed_, done.data));
  }

 private:
  stage& on_;
  std::uint32_t handle_ = 0;
  bytes fed_;
};

class CommandSweepTest : public ::testing::TestWithParam<scenario> {
 protected:
  const scenario& play = GetParam();
  stage on{play.rpmb};
  hosted_tee::fault_plan& faults = on.tee.world().faults();
  hosted_tee::accounting baseline;
  std::uint32_t counted_allocations = 0, counted_calls = 0;
  std::map<std::string, std::uint32_t> counted_steps;  // calls by name

  void expect_baseline() {
    const hosted_tee::accounting now = on.tee.accounting();
    EXPECT_EQ(now.heap_bytes, baseline.heap_bytes);
    EXPECT_EQ(now.heap_blocks, baseline.heap_blocks);
    EXPECT_EQ(now.transient_objects, baseline.transient_objects);
    EXPECT_EQ(now.persistent_objects, baseline.persistent_objects);
    EXPECT_EQ(now.operations, baseline.operations);
  }

  /// A failed command tells so in both places, and has no response.
  void expect_failed(const answer& got) const {
    EXPECT_TRUE(got.result != TEEC_SUCCESS || got.error != KM_ERROR_OK);
    EXPECT_NE(got.error, KM_ERROR_OK);
    EXPECT_NE(got.result, TEEC_ERROR_TARGET_DEAD);
    EXPECT_EQ(got.size, play.keeps_size ? got.output.size() : 0U);
    if (play.zeroes_response) {
      EXPECT_EQ(got.output, bytes(got.output.size(), 0));
    }
  }

  /// run_clean plays without a fault and counts what could have failed.
  void run_clean() {
    if (play.approach) play.approach(on);
    faults.clear();
    const answer got = play.run(on);
    counted_allocations = faults.allocations();
    counted_calls = faults.fallible_calls();
    counted_steps.clear();
    for (const std::string& step : faults.steps()) counted_steps[step] = faults.call_count(step);
    EXPECT_EQ(got.result, play.result);
    EXPECT_EQ(got.error, play.error);
    if (!got.ok()) expect_failed(got);
    if (got.ok() && play.settle) play.settle(on, got);
    expect_baseline();
  }

  /// run_faulty plays with a fault, and once more without. `outlives`: the command may come through the fault.
  template <class Order>
  void run_faulty(Order&& order, bool outlives = false) {
    if (play.approach) play.approach(on);
    faults.clear();
    order();
    const answer got = play.run(on);
    EXPECT_TRUE(faults.triggered());
    faults.clear();
    if (!got.ok() || !outlives) expect_failed(got);
    if (got.ok() && outlives && play.settle) play.settle(on, got);
    expect_baseline();
    run_clean();
  }

  /// expect_whole_pool: 16 operations at a time are still possible.
  void expect_whole_pool() {
    for (const std::uint32_t handle : on.fillers) EXPECT_TRUE(on.client().abort(handle).ok());
    const bytes blob = on.client().must_import(rsa_key(1024), on.key.material());
    const param_list raw = signature(KM_DIGEST_NONE, KM_PAD_NONE);
    for (int i = 0; i < 16; ++i) EXPECT_TRUE(on.client().begin(KM_PURPOSE_SIGN, blob, raw).ok()) << i;
    EXPECT_EQ(on.client().begin(KM_PURPOSE_SIGN, blob, raw).error, KM_ERROR_TOO_MANY_OPERATIONS);
  }
};

constexpr TEE_Result platform_failures[] = {TEE_ERROR_GENERIC, TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_BAD_PARAMETERS};

TEST_P(CommandSweepTest, FailsCleanlyWhateverFailsBelow) {
  play.arrange(on);
  bystander other(on);
  baseline = on.tee.accounting();
  run_clean();
  run_clean();  // and counted here, when whatever the first run set up for good is there
  const std::uint32_t allocations = counted_allocations, calls = counted_calls;
  RecordProperty("allocations", static_cast<int>(allocations));
  RecordProperty("platform_calls", static_cast<int>(calls));

  for (std::uint32_t n = 1; n <= allocations && !HasFailure(); ++n) {
    SCOPED_TRACE(fmt::format("allocation {} of {} fails", n, allocations));
    run_faulty([&] { faults.fail_allocation(n); }, play.may_outlive_memory);
    other.feed();
  }
  for (const TEE_Result result : platform_failures) {
    for (std::uint32_t n = 1; n <= calls && !HasFailure(); ++n) {
      SCOPED_TRACE(fmt::format("platform call {} of {} fails with {:#x}", n, calls, result));
      run_faulty([&] { faults.fail_any_call(n, result); }, play.may_outlive_platform);
      other.feed();
    }
  }
  other.finish();
  expect_whole_pool();
}

/// A step that fails cannot say so. The next call with a result does, in the same command or in the finish of the
/// operation that was spoilt; want of random data ends the instance.
class StepSweepTest : public CommandSweepTest {
 protected:
  /// run_spoilt plays with the n-th call of `step` failing.
  answer run_spoilt(const std::string& step, std::uint32_t n) {
    if (play.approach) play.approach(on);
    faults.clear();
    faults.fail_call(step, n, TEE_ERROR_OUT_OF_MEMORY);
    const answer got = play.run(on);
    EXPECT_TRUE(faults.triggered());
    faults.clear();
    return got;
  }

  void expect_spoilt(const answer& got) {
    if (!got.ok()) return expect_failed(got);
    if (play.begins) on.handle = got.b;
    const finish_answer finished = on.client().finish(on.handle, on.signature, on.with_token());
    EXPECT_EQ(finished.result, TEEC_ERROR_GENERIC);
    expect_failed(finished);
  }
};

TEST_P(StepSweepTest, IsNeverDoneWithASpoiltOperation) {
  play.arrange(on);
  bystander other(on);
  baseline = on.tee.accounting();
  run_clean();
  run_clean();
  std::map<std::string, std::uint32_t> calls = counted_steps;
  const std::uint32_t draws = calls["TEE_GenerateRandom"];
  calls.erase("TEE_GenerateRandom");
  for (const auto& [step, count] : calls) {
    for (std::uint32_t n = 1; n <= count && !HasFailure(); ++n) {
      SCOPED_TRACE(fmt::format("{} number {} fails", step, n));
      expect_spoilt(run_spoilt(step, n));
      expect_baseline();
      run_clean();
      other.feed();
    }
  }
  if (draws == 0) return other.finish();
  // Comes last: with the instance go its operations.
  SCOPED_TRACE("there is no random data");
  const answer got = run_spoilt("TEE_GenerateRandom", draws);
  EXPECT_EQ(got.result, TEEC_ERROR_TARGET_DEAD);
  EXPECT_FALSE(on.tee.world().has_instance(keymaster_ta));
  on.tee.open_session();
  on.fillers.clear();
  expect_whole_pool();
}

std::vector<scenario> all_scenarios() {
  std::vector<scenario> all;
  for (const auto& some : {key_scenarios(), begin_scenarios(), step_scenarios(), finish_scenarios(),
                           algorithm_scenarios(), soter_scenarios()}) {
    all.insert(all.end(), some.begin(), some.end());
  }
  return all;
}

TEST(Scenarios, AreAtLeastFortyWithNamesOfTheirOwn) {
  std::set<std::string> names;
  for (const scenario& play : all_scenarios()) names.emplace(play.name);
  EXPECT_EQ(names.size(), all_scenarios().size());
  EXPECT_GE(names.size(), 40U);
}

INSTANTIATE_TEST_SUITE_P(Every, StepSweepTest, ::testing::ValuesIn(all_scenarios()),
                         [](const auto& played) { return played.param.name; });

INSTANTIATE_TEST_SUITE_P(Every, CommandSweepTest, ::testing::ValuesIn(all_scenarios()),
                         [](const auto& played) { return played.param.name; });

}  // namespace
}  // namespace testing_support
