// The start of the TA while something below fails: no half-started instance stays behind, and the next start works.
#include <fmt/format.h>

#include <functional>

#include "src/params/keymaster_defs.h"
#include "tests/support/device_fixture.h"
#include "tests/support/rsa_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr TEE_Result ksk_deleted = 0xF0100001;

/// The situations that a start can meet.
struct start_scenario {
  const char* name;
  bool rpmb;
  std::function<void(hosted_tee::secure_world&)> approach;  // before each start
  TEE_Result result = TEE_SUCCESS;                          // without a fault
  std::uint32_t ignored_calls = 0;                          // failures that a start survives: the RPMB probe's alone
};

void PrintTo(const start_scenario& play, std::ostream* out) {
  *out << play.name;
}

void as_it_is(hosted_tee::secure_world&) {}
void without_a_key(hosted_tee::secure_world& world) {
  world.delete_object(keymaster_ta, TEE_STORAGE_RPMB, stored_ksk_name);
}
void with_a_malformed_key(hosted_tee::secure_world& world) {
  world.write_object(keymaster_ta, TEE_STORAGE_RPMB, stored_ksk_name, "too short");
}

class StartSweepTest : public ::testing::TestWithParam<start_scenario> {
 protected:
  const start_scenario& play = GetParam();
  device tee{play.rpmb};
  hosted_tee::fault_plan& faults = tee.world().faults();

  /// start opens a session, which makes the instance, and answers why it couldn't.
  TEE_Result start() {
    TEE_Identity client = {};
    TEE_Param none[4] = {};
    std::uint32_t session = 0, origin = 0;
    const TEE_Result result = tee.world().open_session(keymaster_ta, client, 0, none, session, origin);
    if (result == TEE_SUCCESS) {
      EXPECT_TRUE(tee.world().has_instance(keymaster_ta));
      tee.world().close_session(session);
    }
    EXPECT_FALSE(tee.world().has_instance(keymaster_ta));
    return result;
  }

  /// expect_working: a start without faults leads to a TA that makes keys and uses them.
  void expect_working() {
    faults.clear();
    if (play.result == ksk_deleted) without_a_key(tee.world());
    tee.open_session();
    const bytes blob = tee.client().must_import(rsa_key(512), rsa_test_key::of_bits(512).material());
    EXPECT_TRUE(tee.client().sign(blob, signature(KM_DIGEST_NONE, KM_PAD_NONE), {1}).ok());
    tee.close_session();
  }

  /// run_faulty starts with a fault and answers whether the start survived it.
  template <class Order>
  bool run_faulty(Order&& order) {
    play.approach(tee.world());
    faults.clear();
    order();
    const TEE_Result result = start();
    EXPECT_TRUE(faults.triggered());
    expect_working();
    return result == TEE_SUCCESS;
  }
};

TEST_P(StartSweepTest, FailsCleanlyWhateverFailsBelow) {
  tee.close_session();
  play.approach(tee.world());
  faults.clear();
  EXPECT_EQ(start(), play.result);
  const std::uint32_t allocations = faults.allocations(), calls = faults.fallible_calls();
  EXPECT_GT(calls, 0U);

  for (std::uint32_t n = 1; n <= allocations; ++n) {
    SCOPED_TRACE(fmt::format("allocation {} of {} fails", n, allocations));
    EXPECT_FALSE(run_faulty([&] { faults.fail_allocation(n); }));
  }
  for (const TEE_Result failure : {TEE_ERROR_GENERIC, TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_CORRUPT_OBJECT}) {
    std::uint32_t survived = 0;
    for (std::uint32_t n = 1; n <= calls; ++n) {
      SCOPED_TRACE(fmt::format("platform call {} of {} fails with {:#x}", n, calls, failure));
      survived += run_faulty([&] { faults.fail_any_call(n, failure); }) ? 1 : 0;
    }
    EXPECT_EQ(survived, play.ignored_calls);
  }
}

INSTANTIATE_TEST_SUITE_P(Every, StartSweepTest,
                         ::testing::Values(start_scenario{"with_a_stored_key", true, as_it_is, TEE_SUCCESS, 1},
                                           start_scenario{"for_the_first_time", true, without_a_key, TEE_SUCCESS, 1},
                                           start_scenario{"with_a_malformed_key", true, with_a_malformed_key,
                                                          ksk_deleted, 1},
                                           start_scenario{"without_rpmb", false, as_it_is, TEE_SUCCESS, 1}),
                         [](const auto& played) { return std::string(played.param.name); });

}  // namespace
}  // namespace testing_support
