// The first command that needs the soter resources, while something below fails: a load is whole or there is none, and
// the next command loads it.
#include <fmt/format.h>

#include "tests/faults/soter_stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

struct loading_command {
  const char* name;
  answer (*run)(stage& on);
};

void PrintTo(const loading_command& play, std::ostream* out) {
  *out << play.name;
}

answer export_statement(stage& on) {
  return on.client().export_key(on.blob);
}
answer begin_and_abort(stage& on) {
  const answer begun = on.client().begin(KM_PURPOSE_SIGN, on.blob, on.params);
  if (!begun.ok()) return begun;
  EXPECT_TRUE(on.client().abort(begun.b).ok());
  return begun;
}

class SoterLoadSweepTest : public ::testing::TestWithParam<loading_command> {
 protected:
  void SetUp() override {
    on.provision();
    on.import(soter_attk_key());
    on.params = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS);
    (void)export_statement(on);  // creates the counter
    fresh = start();
  }

  /// start begins with a fresh instance, which has loaded nothing.
  hosted_tee::accounting start() {
    on.tee.close_session();
    on.tee.open_session();
    faults.clear();
    return on.tee.accounting();
  }

  /// What is held after the command, and again after another try without a fault.
  template <class Order>
  bool survives(Order&& order) {
    const hosted_tee::accounting before = start();
    order();
    const answer got = GetParam().run(on);
    EXPECT_TRUE(faults.triggered());
    faults.clear();
    EXPECT_NE(got.result, TEEC_ERROR_TARGET_DEAD);
    EXPECT_EQ(on.quil.open_sessions, 0);
    const bool loaded_only = on.tee.accounting().same_holdings(loaded);
    if (!got.ok()) {
      EXPECT_NE(got.error, KM_ERROR_OK);
      // A failure behind the load keeps what was loaded.
      EXPECT_TRUE(loaded_only || on.tee.accounting().same_holdings(before));
      on.quil.calls.clear();
      EXPECT_TRUE(GetParam().run(on).ok());
      EXPECT_EQ(on.quil.calls.size(), loaded_only ? 0U : 3U) << "all is fetched again, or nothing";
      EXPECT_TRUE(on.tee.accounting().same_holdings(loaded));
    }
    return got.ok();
  }

  stage on{true};
  hosted_tee::fault_plan& faults = on.tee.world().faults();
  hosted_tee::accounting fresh, loaded;
};

TEST_P(SoterLoadSweepTest, LoadsAllOrNothing) {
  ASSERT_TRUE(GetParam().run(on).ok());
  loaded = on.tee.accounting();
  EXPECT_FALSE(loaded.same_holdings(fresh));
  const std::uint32_t allocations = faults.allocations(), calls = faults.fallible_calls();
  EXPECT_GT(allocations, 50U);
  EXPECT_GE(calls, 8U);  // three sessions with a command each, and two properties of the platform
  std::uint32_t survived = 0;
  for (std::uint32_t n = 1; n <= allocations && !HasFailure(); ++n) {
    SCOPED_TRACE(fmt::format("allocation {} of {} fails", n, allocations));
    survived += survives([&] { faults.fail_allocation(n); }) ? 1 : 0;
  }
  // A key whose p finds no memory - its entry's record, value and node, or its component - is one of n, e and d.
  EXPECT_EQ(survived, 4U);
  for (const TEE_Result result : {TEE_ERROR_GENERIC, TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_ACCESS_DENIED}) {
    for (std::uint32_t n = 1; n <= calls && !HasFailure(); ++n) {
      SCOPED_TRACE(fmt::format("platform call {} of {} fails with {:#x}", n, calls, result));
      EXPECT_FALSE(survives([&] { faults.fail_any_call(n, result); }));
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Every, SoterLoadSweepTest,
                         ::testing::Values(loading_command{"generate", soter_generate},
                                           loading_command{"export_of_the_attestation_key", soter_export_attk},
                                           loading_command{"export_of_a_key", export_statement},
                                           loading_command{"begin", begin_and_abort}),
                         [](const auto& played) { return std::string(played.param.name); });

}  // namespace
}  // namespace testing_support
