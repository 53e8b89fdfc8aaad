// Who cuts the power has used up an attempt and not won one.
#include <fstream>

#include "tests/companions/authenticator/authenticator_fixture.h"
#include "tests/tee/crash.h"

using namespace keymaster::authenticator;

namespace testing_support {
namespace {

class PowerCutTest : public ::testing::Test {
 protected:
  PowerCutTest() {
    options_.state = folder_.path() / "state";
    const auto world = hosted_tee::secure_world::open(options_);
    companion_session session(*world, AUTHENTICATOR_TA_UUID);
    bytes request = enrol_request({}, {}, right);
    TEE_Param params[4] = {value_slot(alice), memory_slot(request), memory_slot(handle_)};
    EXPECT_EQ(session.invoke(COMMAND_ENROL, enrol_types, params), TEE_SUCCESS);
  }

  const bytes right = from_text("correct horse"), wrong = from_text("incorrect horse");

  /// try_until has a device try a password and lose its power before the platform call of that number (0 = the first).
  /// False: it came to its end before.
  bool try_until(int call, const bytes& password) {
    std::filesystem::remove(looked_);
    return hosted_tee::testing::dies_at(call, [&](const hosted_tee::testing::step_action& at_step) {
      const auto world = hosted_tee::secure_world::open(options_);
      companion_session session(*world, AUTHENTICATOR_TA_UUID);
      world->faults().observe_calls([&](std::uint32_t, std::string_view name) {
        at_step(name);
        if (name == "TEE_MACComputeFinal") std::ofstream(looked_) << "yes";
      });
      bytes request = verify_request(0, handle_, password), token(69);
      TEE_Param params[4] = {value_slot(alice), memory_slot(request), memory_slot(token)};
      (void)session.invoke(COMMAND_VERIFY, verify_types, params);
    });
  }
  [[nodiscard]] bool was_looked_at() const { return std::filesystem::exists(looked_); }

  /// failures reads the count, and clears it.
  std::uint32_t failures() {
    const auto world = hosted_tee::secure_world::open(options_);
    const auto kept = world->read_object(AUTHENTICATOR_TA_UUID, TEE_STORAGE_PRIVATE, "pwauth.fail.1000");
    if (!kept) return 0;
    world->delete_object(AUTHENTICATOR_TA_UUID, TEE_STORAGE_PRIVATE, "pwauth.fail.1000");
    return u32_at(bytes(kept->begin(), kept->end()), 0);
  }

 private:
  temporary_folder folder_;
  hosted_tee::world_options options_;
  std::filesystem::path looked_ = folder_.path() / "looked";
  bytes handle_ = bytes(61);
};

TEST_F(PowerCutTest, AWrongPasswordIsOnRecordBeforeItIsLookedAt) {
  int after = 0, before = 0;
  bool died = true;
  for (int call = 0; died; ++call) {
    SCOPED_TRACE(call);
    died = try_until(call, wrong);
    const bool looked = was_looked_at();
    const std::uint32_t count = failures();
    if (looked || !died) {
      EXPECT_EQ(count, 1U);
    }
    ++(looked ? after : before);
  }
  EXPECT_GT(before, 10);
  EXPECT_GT(after, 2);
}

TEST_F(PowerCutTest, ARightPasswordThatCameToNoEndCountsAsAFailure) {
  bool died = true, counted = false;
  for (int call = 0; died; ++call) {
    SCOPED_TRACE(call);
    died = try_until(call, right);
    const std::uint32_t count = failures();
    EXPECT_LE(count, 1U);
    counted = counted || count == 1;
    if (!died) {
      EXPECT_EQ(count, 0U);
    }
  }
  EXPECT_TRUE(counted);
}

}  // namespace
}  // namespace testing_support
