// The power goes at each step of the storage in turn: the next start finds the state before or the state after.
#include "tests/tee/crash.h"
#include "tests/companions/provisioning/provisioning_fixture.h"
#include "tests/companions/provisioning/reference_box.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

namespace fs = std::filesystem;
using hosted_tee::secure_world;

class CrashTest : public ::testing::Test {
 protected:
  CrashTest() { options.state = folder.path() / "state"; }

  static TEE_Result put_key(secure_world& world, const bytes& box) {
    companion_session session(world, quil_ta, normal_world);
    bytes sent = box;
    TEE_Param params[4] = {memory_slot(sent)};
    return session.invoke(COMMAND_PUT_KEY, 0x0005, params);
  }
  static TEE_Result lock(secure_world& world) {
    companion_session session(world, quil_ta, normal_world);
    TEE_Param params[4] = {};
    return session.invoke(COMMAND_LOCK, 0, params);
  }
  static TEE_Result generate(secure_world& world, bytes& der) {
    companion_session session(world, quil_ta, normal_world);
    der.assign(294, 0);
    TEE_Param params[4] = {value_slot(2048), memory_slot(der)};
    return session.invoke(COMMAND_GENERATE_ATTK, 0x0061, params);
  }
  static bytes key(secure_world& world) {
    const auto text = world.read_object(quil_ta, TEE_STORAGE_PRIVATE, "quil.key");
    return text ? bytes(text->begin(), text->end()) : bytes{};
  }

  /// crash_everywhere ends the process at each step of `change` in turn, on a fresh device that has the old key;
  /// `check` looks at what the next start finds. It answers at how many steps the process died.
  int crash_everywhere(const std::function<TEE_Result(secure_world&)>& change,
                       const std::function<void(secure_world&)>& check) {
    int step = 0;
    for (bool died = true; died; ++step) {
      SCOPED_TRACE("step " + std::to_string(step));
      fs::remove_all(options.state);
      EXPECT_EQ(put_key(*secure_world::open(options), old_box), TEE_SUCCESS);
      died = hosted_tee::testing::dies_at(step, [&](const hosted_tee::testing::step_action& at_step) {
        const auto world = secure_world::open(options);
        world->faults().at_storage_step(at_step);
        if (change(*world) != TEE_SUCCESS) ::abort();
      });
      check(*secure_world::open(options));
    }
    return step - 1;
  }

  temporary_folder folder;
  hosted_tee::world_options options;
  const bytes old_box = attestation_key_box(rsa_test_key::of_bits(1024).components());
  const bytes new_box = attestation_key_box(rsa_test_key::of_bits(2048).components());
  int unchanged = 0, changed = 0;
};

TEST_F(CrashTest, AGeneratedKeyIsThereWholeOrTheOldOneStays) {
  const auto change = [](secure_world& world) {
    bytes der;
    return generate(world, der);
  };
  const int steps = crash_everywhere(change, [&](secure_world& world) {
    const bytes found = key(world);
    if (found == old_box) {
      ++unchanged;
    } else {
      ++changed;
      EXPECT_TRUE(is_key_pair(components_of(found)));
    }
  });
  EXPECT_GE(steps, 2);
  EXPECT_GE(unchanged, 1);
  EXPECT_GE(changed, 1);
}

TEST_F(CrashTest, AKeyThatIsPutIsThereWholeOrTheOldOneStays) {
  const int steps = crash_everywhere([&](secure_world& world) { return put_key(world, new_box); },
                                     [&](secure_world& world) {
                                       ++(key(world) == old_box ? unchanged : changed);
                                       EXPECT_THAT(key(world), ::testing::AnyOf(old_box, new_box));
                                     });
  EXPECT_GE(steps, 2);
  EXPECT_GE(unchanged, 1);
  EXPECT_GE(changed, 1);
}

TEST_F(CrashTest, ADeviceIsLockedOrItIsNotAndCanBeLockedThen) {
  const int steps = crash_everywhere(lock, [&](secure_world& world) {
    const bool is_locked = world.read_object(quil_ta, TEE_STORAGE_PRIVATE, "quil.lock").has_value();
    ++(is_locked ? changed : unchanged);
    EXPECT_EQ(put_key(world, new_box), is_locked ? TEE_ERROR_ACCESS_DENIED : TEE_SUCCESS);
    EXPECT_EQ(key(world), is_locked ? old_box : new_box);
    EXPECT_EQ(lock(world), TEE_SUCCESS);
    EXPECT_EQ(put_key(world, old_box), TEE_ERROR_ACCESS_DENIED);
  });
  EXPECT_GE(steps, 2);
  EXPECT_GE(unchanged, 1);
  EXPECT_GE(changed, 1);
}

TEST_F(CrashTest, WhatWasAnsweredIsThereForGood) {
  bytes der;
  EXPECT_TRUE(hosted_tee::testing::dies_at(0, [&](const hosted_tee::testing::step_action& at_step) {
    const auto world = secure_world::open(options);
    if (put_key(*world, new_box) == TEE_SUCCESS && lock(*world) == TEE_SUCCESS) at_step("returned");
  }));
  const auto world = secure_world::open(options);
  EXPECT_EQ(key(*world), new_box);
  EXPECT_EQ(generate(*world, der), TEE_ERROR_ACCESS_DENIED);
}

}  // namespace
}  // namespace testing_support
