// Every allocation and every platform call of every command fails once: the command fails, keeps nothing, changes
// nothing in storage, and works again the next time.
#include <fmt/format.h>

#include "tests/companions/fingerprint/fingerprint_fixture.h"

using namespace keymaster::fingerprint;

namespace testing_support {
namespace {

constexpr std::uint64_t alice = 0x1122334455667788;

class FingerprintFaultTest : public FingerprintTest {
 protected:
  FingerprintFaultTest() {
    for (int i = 0; i < 3; ++i) must_enrol(alice);
    must_touch(1);
  }

  /// sweep lets each thing that `command` needs fail once. `undo` puts back what the command changed.
  void sweep(
      const std::function<TEE_Result()>& command, const std::function<void()>& undo = [] {}) {
    faults().clear();
    const stored_objects before = stored_now();
    EXPECT_EQ(command(), TEE_SUCCESS);
    const std::uint32_t allocations = faults().allocations(), calls = faults().fallible_calls();
    undo();
    for (std::uint32_t n = 1; n <= allocations; ++n) {
      SCOPED_TRACE(fmt::format("allocation {} of {}", n, allocations));
      expect_fails([&] { faults().fail_allocation(n); }, TEE_ERROR_OUT_OF_MEMORY, command);
    }
    for (std::uint32_t n = 1; n <= calls; ++n) {
      SCOPED_TRACE(fmt::format("platform call {} of {}", n, calls));
      expect_fails([&] { faults().fail_any_call(n, TEE_ERROR_STORAGE_NO_SPACE); }, TEE_ERROR_STORAGE_NO_SPACE, command);
    }
    EXPECT_EQ(stored_now(), before);
    EXPECT_EQ(command(), TEE_SUCCESS);
  }

 private:
  void expect_fails(const std::function<void()>& order, TEE_Result result, const std::function<TEE_Result()>& command) {
    const hosted_tee::accounting held = holdings();
    const stored_objects kept = stored_now();
    faults().clear();
    order();
    EXPECT_EQ(command(), result);
    EXPECT_TRUE(faults().triggered());
    faults().clear();
    expect_same_holdings(held);
    EXPECT_EQ(stored_now(), kept);
  }
};

TEST_F(FingerprintFaultTest, EnrolmentFailsCleanly) {
  const bytes before = *stored("fp.templates");
  sweep([&] { return enrol(alice).result; }, [&] { store("fp.templates", before); });
}

TEST_F(FingerprintFaultTest, TheFirstEnrolmentOfADeviceFailsCleanly) {
  const auto forget = [&] { tee.world().delete_object(FINGERPRINT_TA_UUID, TEE_STORAGE_PRIVATE, "fp.templates"); };
  forget();
  sweep([&] { return enrol(alice).result; }, forget);
}

TEST_F(FingerprintFaultTest, RemovalFailsCleanly) {
  const bytes before = *stored("fp.templates");
  sweep([&] { return remove(2); }, [&] { store("fp.templates", before); });
}

TEST_F(FingerprintFaultTest, ListingFailsCleanly) {
  sweep([&] {
    const list_answer got = list();
    if (got.result == TEE_SUCCESS) {
      EXPECT_EQ(got.size, 36U);
    } else {
      EXPECT_NE(got.size, 36U);
      EXPECT_EQ(got.records, bytes(384, canary));
    }
    return got.result;
  });
}

/// The news to the Keymaster TA may fail; everything before it may not, and then there is no news.
TEST_F(FingerprintFaultTest, ATouchFailsCleanlyUntilThereIsAToken) {
  std::uint32_t own_calls = 0;
  faults().clear();
  faults().observe_calls([&](std::uint32_t number, std::string_view name) {
    if (name == "TEE_OpenTASession") own_calls = number;
  });
  ASSERT_EQ(touch(1).result, TEE_SUCCESS);
  faults().observe_calls({});
  ASSERT_GT(own_calls, 0U);
  for (std::uint32_t n = 1;; ++n) {
    SCOPED_TRACE(n);
    const hosted_tee::accounting held = holdings();
    const stored_objects kept = stored_now();
    faults().clear();
    faults().fail_any_call(n, TEE_ERROR_STORAGE_NO_SPACE);
    const touch_answer got = touch(1);
    const bool told = faults().call_count("TEE_OpenTASession") != 0;
    ASSERT_TRUE(faults().triggered());
    expect_same_holdings(held);
    EXPECT_EQ(stored_now(), kept);
    if (told) {
      EXPECT_EQ(got.result, TEE_SUCCESS);
      EXPECT_EQ(got.told, TEE_ERROR_STORAGE_NO_SPACE);
      EXPECT_GT(n, 5U);
      break;
    }
    EXPECT_EQ(got.result, TEE_ERROR_STORAGE_NO_SPACE);
    // The first call asks who the client is; before that is known, no slot is touched.
    EXPECT_EQ(got.size, n == 1 ? 69U : 0U);
    EXPECT_EQ(got.token, bytes(69, canary));
    EXPECT_EQ(got.told, 0U);
  }
}

TEST_F(FingerprintFaultTest, ATouchFailsCleanlyForWantOfMemory) {
  for (std::uint32_t n = 1; n <= 2; ++n) {
    faults().clear();
    faults().fail_allocation(n);
    expect_refused(
        TEE_ERROR_OUT_OF_MEMORY,
        n == 1 ? std::vector<std::string>{} : std::vector<std::string>{"Read stored object failed with 0xffff000c\n"},
        [&] { return touch(1).result; });
    EXPECT_TRUE(faults().triggered());
    EXPECT_EQ(faults().call_count("TEE_OpenTASession"), 0U);
  }
}

TEST_F(FingerprintFaultTest, AMacThatCannotBeMadeYieldsNoToken) {
  for (const char* const step : {"TEE_MACInit", "TEE_MACUpdate"}) {
    faults().clear();
    faults().fail_call(step, 1, TEE_ERROR_OUT_OF_MEMORY);
    expect_refused(TEE_ERROR_GENERIC, {"MACComputeFinal failed with 0xffff0000, 0 bytes\n"}, [&] {
      const touch_answer got = touch(1);
      EXPECT_EQ(got.size, 0U);
      EXPECT_EQ(got.token, bytes(69, canary));
      return got.result;
    });
  }
  faults().override_output("TEE_MACComputeFinal", 1, [](std::uint32_t* length, TEE_Result&) { *length = 31; });
  expect_refused(TEE_ERROR_GENERIC, {"MACComputeFinal failed with 0xffff0000, 31 bytes\n"},
                 [&] { return touch(1).result; });
}

TEST_F(FingerprintFaultTest, ADeviceWithoutRandomDataGivesNoToken) {
  tee.world().delete_object(FINGERPRINT_TA_UUID, TEE_STORAGE_PRIVATE, "fp.authid");
  const stored_objects before = stored_now();
  faults().fail_call("TEE_GenerateRandom", 1, TEE_ERROR_GENERIC);
  EXPECT_EQ(touch(1).result, TEE_ERROR_TARGET_DEAD);
  open_session();
  EXPECT_EQ(stored_now(), before);
  EXPECT_EQ(touch(1).result, TEE_SUCCESS);
}

}  // namespace
}  // namespace testing_support
