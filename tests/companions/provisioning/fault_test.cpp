// Every allocation and every platform call of every command fails once. The command fails with it, the TA holds what it
// held, and what is stored stays.
#include <fmt/format.h>

#include <functional>

#include "tests/companions/provisioning/provisioning_fixture.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

class FaultTest : public ProvisioningTest {
 protected:
  void SetUp() override {
    ASSERT_EQ(put_key(old_box), TEE_SUCCESS);
    ASSERT_EQ(put_data(pattern(40)), TEE_SUCCESS);
    ASSERT_EQ(put_property(cpu_id, pattern(20)), TEE_SUCCESS);
  }

  void expect_nothing_changed() {
    EXPECT_EQ(stored("quil.key"), old_box);
    EXPECT_EQ(stored("quil.data"), pattern(40));
    EXPECT_EQ(stored("quil.prop.1734.173a"), pattern(20));
    EXPECT_EQ(stored("quil.lock"), std::nullopt);
  }

  /// sweep runs `command` with each of its allocations and calls failing in turn, or with every `stride`-th, and then
  /// without a fault. It answers how many there were, rounded up to the stride.
  struct counts {
    std::uint32_t allocations, calls;
  };
  counts sweep(const std::function<TEE_Result()>& command, std::uint32_t stride = 1) {
    counts seen = {0, 0};
    for (bool failed = true; failed && !HasFailure(); seen.allocations += failed ? stride : 0) {
      SCOPED_TRACE(fmt::format("after {} allocations", seen.allocations));
      failed = fails(command, TEE_ERROR_OUT_OF_MEMORY, [&] { faults().fail_allocation(seen.allocations + 1); });
      if (failed) expect_nothing_changed();
      if (!failed) restore();
    }
    for (bool failed = true; failed && !HasFailure(); seen.calls += failed ? stride : 0) {
      SCOPED_TRACE(fmt::format("after {} calls", seen.calls));
      failed = fails(command, TEE_ERROR_STORAGE_NO_SPACE,
                     [&] { faults().fail_any_call(seen.calls + 1, TEE_ERROR_STORAGE_NO_SPACE); });
      if (failed) expect_nothing_changed();
    }
    return seen;
  }

  /// What the command has changed, when nothing failed any more, is put back.
  std::function<void()> restore = [] {};

  const bytes old_box = attestation_key_box(rsa_test_key::of_bits(1024).components());
  const bytes new_box = attestation_key_box(rsa_test_key::of_bits(2048).components());
  const bytes cpu_id = from_hex(cpu_id_property);

 private:
  /// Runs the command with one fault. False: it came to its end without meeting the fault, and succeeded.
  bool fails(const std::function<TEE_Result()>& command, TEE_Result expected, const std::function<void()>& order) {
    const hosted_tee::accounting before = holdings();
    faults().clear();
    order();
    const TEE_Result result = command();
    const bool triggered = faults().triggered();
    faults().clear();
    EXPECT_EQ(result, triggered ? expected : TEE_SUCCESS);
    expect_same_holdings(before);
    return triggered;
  }
};

TEST_F(FaultTest, PutKey) {
  restore = [&] { ASSERT_EQ(put_key(old_box), TEE_SUCCESS); };
  const counts seen = sweep([&] { return put_key(new_box); });
  EXPECT_EQ(seen.allocations, 1U);
  EXPECT_EQ(seen.calls, 3U);  // who asks, whether the device is locked, and the storing
  EXPECT_EQ(stored("quil.key"), new_box);
}

TEST_F(FaultTest, PutData) {
  restore = [&] { ASSERT_EQ(put_data(pattern(40)), TEE_SUCCESS); };
  const counts seen = sweep([&] { return put_data(pattern(41)); });
  EXPECT_EQ(seen.allocations, 1U);
  EXPECT_EQ(seen.calls, 3U);
  EXPECT_EQ(stored("quil.data"), pattern(41));
}

TEST_F(FaultTest, PutProperty) {
  restore = [&] { ASSERT_EQ(put_property(cpu_id, pattern(20)), TEE_SUCCESS); };
  const counts seen = sweep([&] { return put_property(cpu_id, pattern(21)); });
  EXPECT_EQ(seen.allocations, 1U);
  EXPECT_EQ(seen.calls, 3U);
  EXPECT_EQ(stored("quil.prop.1734.173a"), pattern(21));
}

TEST_F(FaultTest, GetKeyDataAndProperty) {
  const std::function<quil_answer()> commands[] = {[&] { return get_key(); }, [&] { return get_data(); },
                                                   [&] { return get_property(cpu_id); }};
  for (const auto& command : commands) {
    const counts seen = sweep([&] {
      const quil_answer got = command();
      EXPECT_TRUE(got.result == TEE_SUCCESS || got.buffer == bytes(got.buffer.size(), canary));
      return got.result;
    });
    EXPECT_EQ(seen.allocations, 1U);
    EXPECT_EQ(seen.calls, 3U);  // who asks, opening, and reading
  }
  expect_nothing_changed();
}

// The slow one: a key is made each time, which takes seconds under emulation. Everything that can fail comes before the
// storing, which is the last call.
TEST_F(FaultTest, GenerateAttk) {
  restore = [&] { ASSERT_EQ(put_key(old_box), TEE_SUCCESS); };
  const counts seen = sweep(
      [&] {
        const quil_answer got = generate();
        EXPECT_TRUE(got.result == TEE_SUCCESS || got.buffer == bytes(294, canary));
        return got.result;
      },
      KEY_GENERATION_STRIDE);
  EXPECT_GT(seen.allocations, 8U * 3);
  EXPECT_GT(seen.calls, 8U);
  EXPECT_NE(stored("quil.key"), old_box);
}

TEST_F(FaultTest, Lock) {
  restore = [&] { tee.world().delete_object(quil_ta, TEE_STORAGE_PRIVATE, "quil.lock"); };
  const counts seen = sweep([&] { return lock(); });
  EXPECT_EQ(seen.allocations, 0U);
  EXPECT_EQ(seen.calls, 3U);
  EXPECT_TRUE(stored("quil.lock").has_value());
}

TEST_F(FaultTest, Status) {
  const counts seen = sweep([&] {
    TEE_Param params[4] = {};
    return invoke(COMMAND_STATUS, 0x0002, params);
  });
  EXPECT_EQ(seen.allocations, 0U);
  EXPECT_EQ(seen.calls, 6U);
}

}  // namespace
}  // namespace testing_support
