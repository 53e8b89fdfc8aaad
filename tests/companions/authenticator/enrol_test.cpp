// Passwords are enrolled, and changed by who knows the present one.
#include "tests/companions/authenticator/authenticator_fixture.h"

using namespace keymaster::authenticator;

namespace testing_support {
namespace {

class EnrolTest : public AuthenticatorTest {
 protected:
  const bytes second = from_text("battery staple");
};

TEST_F(EnrolTest, ANewUserGetsAHandleAndASecureId) {
  tee.clear_trace();
  const password_answer got = enrol(alice, right);
  EXPECT_EQ(got.result, TEE_SUCCESS);
  EXPECT_EQ(got.size, 61U);
  EXPECT_NE(got.secure_id(), 0U);
  EXPECT_THAT(errors(), ::testing::IsEmpty());
  EXPECT_EQ(failures(alice), record{});
}

TEST_F(EnrolTest, EveryEnrolmentAnewDrawsAnotherSecureIdAndSalt) {
  const password_answer one = must_enrol(alice, right), two = must_enrol(alice, right), other = must_enrol(bob, right);
  EXPECT_NE(one.secure_id(), two.secure_id());
  EXPECT_NE(two.secure_id(), other.secure_id());
  EXPECT_NE(bytes(one.output.begin() + 13, one.output.begin() + 29),
            bytes(two.output.begin() + 13, two.output.begin() + 29));
}

TEST_F(EnrolTest, WhoKnowsThePresentPasswordKeepsTheSecureId) {
  const password_answer before = must_enrol(alice, right);
  const password_answer after = enrol(alice, second, before.output, right);
  ASSERT_EQ(after.result, TEE_SUCCESS);
  EXPECT_EQ(after.size, 61U);
  EXPECT_EQ(after.secure_id(), before.secure_id());
  EXPECT_NE(after.output, before.output);
  must_verify(alice, after.output, second);
  expect_denied(alice, after.output, right);
  expect_denied(alice, before.output, second);
}

TEST_F(EnrolTest, ThePresentPasswordMustBeRight) {
  const bytes handle = must_enrol(alice, right).output;
  const std::pair<bytes, bytes> shown[] = {{handle, wrong}, {handle, {}}, {{}, right}, {bytes(61), right}};
  for (std::uint32_t failed = 0; const auto& [with_handle, with_password] : shown) {
    tee.clear_trace();
    const password_answer got = enrol(alice, second, with_handle, with_password);
    EXPECT_EQ(got.result, TEE_ERROR_ACCESS_DENIED);
    EXPECT_THAT(errors(), ::testing::ElementsAre("Wrong password or handle\n"));
    EXPECT_EQ(got.size, 0U);
    EXPECT_EQ(got.output, bytes(61, canary));
    EXPECT_EQ(got.secure_id(), 0U);
    EXPECT_EQ(failures(alice), (record{++failed, now_ms()}));
  }
}

TEST_F(EnrolTest, TheRightPresentPasswordEndsARowOfFailures) {
  const bytes handle = must_enrol(alice, right).output;
  fail(alice, handle, 4);
  ASSERT_EQ(enrol(alice, second, handle, right).result, TEE_SUCCESS);
  EXPECT_EQ(failures(alice), record{});
}

TEST_F(EnrolTest, AChangeMustWaitLikeAnyAttempt) {
  const bytes handle = must_enrol(alice, right).output;
  fail(alice, handle, 5);
  advance(1);
  expect_refused(TEE_ERROR_BUSY, {"5 failures, wait for 29999 ms\n"}, [&] {
    const password_answer got = enrol(alice, second, handle, right);
    EXPECT_EQ(got.a, 29'999U);
    EXPECT_EQ(got.b, 0U);
    EXPECT_EQ(got.size, 0U);
    EXPECT_EQ(got.output, bytes(61, canary));
    return got.result;
  });
  advance(29'999);
  EXPECT_EQ(enrol(alice, second, handle, right).result, TEE_SUCCESS);
}

/// Otherwise it would be the way to try the present password for ever.
TEST_F(EnrolTest, AnEnrolmentAnewEndsNoRowOfFailures) {
  const bytes handle = must_enrol(alice, right).output;
  fail(alice, handle, 5);
  const bytes fresh = must_enrol(alice, second).output;
  EXPECT_EQ(failures(alice).count, 5U);
  expect_busy(alice, handle, right, 30'000);
  expect_busy(alice, fresh, second, 30'000);
}

TEST_F(EnrolTest, PasswordsHaveFrom1To1024Bytes) {
  for (const std::size_t size : {0U, 1025U, 70'000U}) {
    SCOPED_TRACE(size);
    expect_refused(TEE_ERROR_BAD_PARAMETERS, {"Malformed request\n"}, [&] {
      const password_answer got = enrol(alice, bytes(size, 'p'));
      EXPECT_EQ(got.size, 0U);
      EXPECT_EQ(got.secure_id(), 0U);
      return got.result;
    });
  }
  for (const std::size_t size : {1U, 1024U}) {
    SCOPED_TRACE(size);
    const bytes password(size, 'p');
    must_verify(alice, must_enrol(alice, password).output, password);
  }
}

TEST_F(EnrolTest, ABadNewPasswordIsNoAttemptAtThePresentOne) {
  const bytes handle = must_enrol(alice, right).output;
  for (const bytes& bad : {bytes{}, bytes(1025)}) {
    expect_refused(TEE_ERROR_BAD_PARAMETERS, {"Malformed request\n"},
                   [&] { return enrol(alice, bad, handle, wrong).result; });
  }
}

TEST_F(EnrolTest, EveryUidIsAUser) {
  for (const std::uint32_t uid : {0U, 1U, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFFFU}) {
    const bytes handle = must_enrol(uid, right).output;
    must_verify(uid, handle, right);
    fail(uid, handle, 1);
    EXPECT_EQ(failures(uid).count, 1U);
  }
}

}  // namespace
}  // namespace testing_support
