// Every allocation and every platform call of every command fails once: the command fails, keeps nothing, and works
// again the next time. A failure is taken back from a user's record only by the right password.
#include <fmt/format.h>

#include "tests/companions/authenticator/authenticator_fixture.h"

using namespace keymaster::authenticator;

namespace testing_support {
namespace {

constexpr std::uint32_t failed_before = 3;

class AuthenticatorFaultTest : public AuthenticatorTest {
 protected:
  AuthenticatorFaultTest() { must_verify(alice, handle, right); }

  const bytes handle = must_enrol(alice, right).output;
  const bytes second = from_text("battery staple");
  const record before = {failed_before, now_ms() - 5};

  using command = std::function<password_answer()>;

  /// sweep lets each thing that `run` needs fail once, from the same state each time, and has `check` look at the
  /// record of failures after each.
  void sweep(const command& run, const std::function<void(const record& now)>& check) {
    reset();
    const TEE_Result without_fault = run().result;
    const std::uint32_t allocations = faults().allocations(), calls = faults().fallible_calls();
    ASSERT_GT(allocations, 3U);
    ASSERT_GT(calls, 10U);
    for (std::uint32_t n = 1; n <= allocations; ++n) {
      SCOPED_TRACE(fmt::format("allocation {} of {}", n, allocations));
      expect_cleared(expect_fails(run, TEE_ERROR_OUT_OF_MEMORY, [&] { faults().fail_allocation(n); }));
      check(failures(alice));
    }
    for (std::uint32_t n = 1; n <= calls; ++n) {
      SCOPED_TRACE(fmt::format("platform call {} of {}", n, calls));
      const password_answer got =
          expect_fails(run, TEE_ERROR_STORAGE_NO_SPACE, [&] { faults().fail_any_call(n, TEE_ERROR_STORAGE_NO_SPACE); });
      // The first call asks who the client is; before that is known, no slot is touched.
      if (n > 1) expect_cleared(got);
      check(failures(alice));
    }
    reset();
    EXPECT_EQ(run().result, without_fault);
  }

 private:
  void reset() {
    set_failures(alice, before);
    faults().clear();
  }
  password_answer expect_fails(const command& run, TEE_Result result, const std::function<void()>& order) {
    reset();
    const hosted_tee::accounting held = holdings();
    const auto key = stored("pwauth.key"), id = stored("pwauth.authid");
    order();
    const password_answer got = run();
    EXPECT_TRUE(faults().triggered());
    faults().clear();
    EXPECT_EQ(got.result, result);
    EXPECT_EQ(got.output, bytes(got.output.size(), canary));
    expect_same_holdings(held);
    EXPECT_EQ(stored("pwauth.key"), key);
    EXPECT_EQ(stored("pwauth.authid"), id);
    return got;
  }
  static void expect_cleared(const password_answer& got) {
    EXPECT_EQ(got.size, 0U);
    EXPECT_EQ(got.a, 0U);
    EXPECT_EQ(got.b, 0U);
  }
};

TEST_F(AuthenticatorFaultTest, AVerificationOfTheRightPasswordFailsCleanly) {
  // It stays as it was until the password is known to be right. When just that can't be written down, the failure
  // stays; when the token can't be made after it, the row has ended all the same.
  const record counted = {failed_before + 1, now_ms()};
  int stayed = 0, ended = 0;
  sweep([&] { return verify(alice, handle, right); },
        [&](const record& now) {
          EXPECT_TRUE(now == before || now == counted || now == record{});
          stayed += now == counted;
          ended += now == record{};
        });
  EXPECT_EQ(stayed, 1);
  EXPECT_GT(ended, 3);
}

TEST_F(AuthenticatorFaultTest, AVerificationOfAWrongPasswordNeverTakesAFailureBack) {
  sweep([&] { return verify(alice, handle, wrong); }, [&](const record& now) { EXPECT_EQ(now, before); });
  EXPECT_EQ(failures(alice), (record{failed_before + 1, now_ms()}));
}

TEST_F(AuthenticatorFaultTest, AChangeOfThePasswordFailsCleanly) {
  const record counted = {failed_before + 1, now_ms()};
  sweep([&] { return enrol(alice, second, handle, right); },
        [&](const record& now) { EXPECT_TRUE(now == before || now == counted || now == record{}); });
}

TEST_F(AuthenticatorFaultTest, TheFirstUseOfADeviceFailsCleanly) {
  for (std::uint32_t n = 1;; ++n) {
    SCOPED_TRACE(n);
    for (const char* const name : {"pwauth.key", "pwauth.authid", "pwauth.fail.1000"}) {
      tee.world().delete_object(AUTHENTICATOR_TA_UUID, TEE_STORAGE_PRIVATE, name);
    }
    faults().clear();
    faults().fail_any_call(n, TEE_ERROR_STORAGE_NO_SPACE);
    const password_answer got = enrol(alice, right);
    const bool failed = faults().triggered();
    faults().clear();
    EXPECT_EQ(got.result, failed ? TEE_ERROR_STORAGE_NO_SPACE : TEE_SUCCESS);
    if (!failed) break;
    EXPECT_EQ(got.output, bytes(61, canary));
    // A key that was drawn and not stored must not have made anything.
    const bytes later = must_enrol(alice, right).output;
    must_verify(alice, later, right);
  }
}

TEST_F(AuthenticatorFaultTest, AFailureThatCannotBeWrittenDownKeepsThePasswordFromBeingLookedAt) {
  set_failures(alice, before);
  for (const bytes& password : {right, wrong}) {
    faults().clear();
    faults().fail_call("TEE_CreatePersistentObject", 1, TEE_ERROR_STORAGE_NO_SPACE);
    expect_refused(TEE_ERROR_STORAGE_NO_SPACE, {"Write stored object failed with 0xffff3041\n"},
                   [&] { return verify(alice, handle, password).result; });
    EXPECT_EQ(faults().call_count("TEE_MACComputeFinal"), 0U);
  }
}

TEST_F(AuthenticatorFaultTest, ASuccessThatCannotBeWrittenDownIsNone) {
  set_failures(alice, before);
  faults().fail_call("TEE_CreatePersistentObject", 2, TEE_ERROR_STORAGE_NO_SPACE);
  const password_answer got = verify(alice, handle, right);
  EXPECT_EQ(got.result, TEE_ERROR_STORAGE_NO_SPACE);
  EXPECT_EQ(got.size, 0U);
  EXPECT_EQ(got.output, bytes(69, canary));
  EXPECT_EQ(failures(alice), (record{failed_before + 1, now_ms()}));
}

TEST_F(AuthenticatorFaultTest, AMacThatCannotBeMadeIsNoAnswer) {
  for (const char* const step : {"TEE_MACInit", "TEE_MACUpdate"}) {
    for (const bytes& password : {right, wrong}) {
      set_failures(alice, before);
      faults().clear();
      faults().fail_call(step, 1, TEE_ERROR_OUT_OF_MEMORY);
      expect_refused(TEE_ERROR_GENERIC, {"MACComputeFinal failed with 0xffff0000, 0 bytes\n"},
                     [&] { return verify(alice, handle, password).result; });
    }
  }
}

/// Nor may a MAC of no bytes, which would equal one of a handle that is all zero.
TEST_F(AuthenticatorFaultTest, AMacOfAnotherLengthIsNoAnswer) {
  set_failures(alice, before);
  bytes hollow = handle;
  std::fill(hollow.begin() + 29, hollow.end(), std::uint8_t{0});
  for (const std::uint32_t length : {0U, 31U, 33U}) {
    faults().override_output("TEE_MACComputeFinal", 1, [=](std::uint32_t* told, TEE_Result&) { *told = length; });
    expect_refused(TEE_ERROR_GENERIC, {fmt::format("MACComputeFinal failed with 0xffff0000, {} bytes\n", length)},
                   [&] { return verify(alice, hollow, right).result; });
  }
}

TEST_F(AuthenticatorFaultTest, ADeviceWithoutRandomDataEnrolsNobody) {
  const stored_objects kept = stored_now();
  for (std::uint32_t n = 1; n <= 2; ++n) {
    faults().clear();
    faults().fail_call("TEE_GenerateRandom", n, TEE_ERROR_GENERIC);
    EXPECT_EQ(enrol(alice, right).result, TEE_ERROR_TARGET_DEAD);
    open_session();
  }
  EXPECT_EQ(stored_now(), kept);
  must_verify(alice, handle, right);
}

}  // namespace
}  // namespace testing_support
