// Password handles: their form, and what becomes of any other.
#include "tests/companions/authenticator/authenticator_fixture.h"

using namespace keymaster::authenticator;

namespace testing_support {
namespace {

class HandleTest : public AuthenticatorTest {
 protected:
  const password_answer enrolled = must_enrol(alice, right);
  const bytes handle = enrolled.output;

  void forget_failures() { set_failures(alice, {}); }

  /// forge makes a handle with the TA's own key, as nobody can who has not got it.
  bytes forge(std::uint8_t version, std::uint32_t uid, const bytes& password) {
    const bytes head = join({bytes{version}, u32(uid), u64(77), bytes(16, 's')});
    return join({head, hmac_sha256_of(*stored("pwauth.key"), join({head, password}))});
  }
};

TEST_F(HandleTest, HasEachFieldInItsPlace) {
  ASSERT_EQ(handle.size(), 61U);
  EXPECT_EQ(bytes(handle.begin(), handle.begin() + 13), join({bytes{0}, u32(alice), u64(enrolled.secure_id())}));
  const bytes head(handle.begin(), handle.begin() + 29);
  EXPECT_EQ(bytes(handle.begin() + 29, handle.end()), hmac_sha256_of(*stored("pwauth.key"), join({head, right})));
}

TEST_F(HandleTest, TheKeyBehindItIs32BytesAndStays) {
  const bytes key = *stored("pwauth.key");
  EXPECT_EQ(key.size(), 32U);
  EXPECT_NE(key, bytes(32));
  restart();
  must_verify(alice, handle, right);
  must_enrol(bob, right);
  EXPECT_EQ(stored("pwauth.key"), key);
}

TEST_F(HandleTest, AnyChangedByteMakesItWorthless) {
  for (std::size_t at = 0; at < handle.size(); ++at) {
    SCOPED_TRACE(at);
    expect_denied(alice, flip(handle, at), right);
    forget_failures();
  }
  must_verify(alice, handle, right);
}

TEST_F(HandleTest, AnyOtherLengthMakesItWorthless) {
  for (const std::size_t size : {0U, 1U, 29U, 60U, 62U, 70'000U}) {
    SCOPED_TRACE(size);
    bytes cut = handle;
    cut.resize(size);
    expect_denied(alice, cut, right);
    forget_failures();
  }
}

TEST_F(HandleTest, OfAnotherUserIsWorthlessAndCountsForWhoTried) {
  const bytes of_bob = must_enrol(bob, right).output;
  expect_denied(alice, of_bob, right);
  EXPECT_EQ(failures(bob), record{});
  expect_denied(bob, handle, right);
  EXPECT_EQ(failures(alice).count, 1U);
}

TEST_F(HandleTest, OfAnotherDeviceIsWorthless) {
  device elsewhere;
  companion_session session(elsewhere.world(), AUTHENTICATOR_TA_UUID);
  bytes request = enrol_request({}, {}, right), foreign(61);
  TEE_Param params[4] = {value_slot(alice), memory_slot(request), memory_slot(foreign)};
  ASSERT_EQ(session.invoke(COMMAND_ENROL, enrol_types, params), TEE_SUCCESS);
  expect_denied(alice, foreign, right);
}

TEST_F(HandleTest, CountsOnlyInItsVersionAndForItsUserEvenUnderTheRightKey) {
  must_verify(alice, forge(0, alice, right), right);  // the forgery works
  expect_denied(alice, forge(1, alice, right), right);
  expect_denied(alice, forge(0, bob, right), right);
}

TEST_F(HandleTest, AKeyThatIsNoneIsRefusedAndKept) {
  for (const std::size_t size : {0U, 31U, 33U}) {
    store("pwauth.key", bytes(size));
    const std::vector<std::string> lines = {"A stored object has " + std::to_string(size) +
                                            " bytes or more instead of 32\n"};
    expect_refused(TEE_ERROR_BAD_STATE, lines, [&] { return verify(alice, handle, right).result; });
    expect_refused(TEE_ERROR_BAD_STATE, lines, [&] { return enrol(alice, right).result; });
  }
}

}  // namespace
}  // namespace testing_support
