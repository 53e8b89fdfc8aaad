// Keys that a finger unlocks.
#include "tests/companions/fingerprint/fingerprint_fixture.h"
#include "tests/companions/guarded_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint64_t alice = 0x1122334455667788, bob = 0xFFEEDDCCBBAA9988;
constexpr std::uint32_t password = 1, finger_touch = 2;

class FingerKeyTest : public FingerprintTest {
 protected:
  const std::uint32_t finger = must_enrol(alice);
};

TEST_F(FingerKeyTest, ATouchForTheOperationUnlocksIt) {
  guarded_key key(keymaster(), alice, finger_touch);
  EXPECT_EQ(key.use([&](std::uint32_t handle) { return must_touch(finger, handle); }), KM_ERROR_OK);
}

TEST_F(FingerKeyTest, AnEitherOrKeyTakesAFinger) {
  guarded_key key(keymaster(), alice, password | finger_touch);
  EXPECT_EQ(key.use([&](std::uint32_t handle) { return must_touch(finger, handle); }), KM_ERROR_OK);
}

TEST_F(FingerKeyTest, ATouchForAnotherOperationDoesNot) {
  guarded_key key(keymaster(), alice, finger_touch);
  for (const std::uint64_t off : {std::uint64_t{1}, std::uint64_t{1} << 32}) {
    tee.clear_trace();
    EXPECT_EQ(key.use([&](std::uint32_t handle) { return must_touch(finger, handle + off); }),
              KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
    EXPECT_TRUE(tee.traced("Challenge mismatch"));
  }
}

TEST_F(FingerKeyTest, AnotherUsersFingerDoesNot) {
  guarded_key key(keymaster(), alice, finger_touch);
  const std::uint32_t other = must_enrol(bob);
  EXPECT_EQ(key.use([&](std::uint32_t handle) { return must_touch(other, handle); }),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_TRUE(tee.traced("User id mismatch"));
}

TEST_F(FingerKeyTest, AKeyThatWantsThePasswordTakesNoFinger) {
  guarded_key key(keymaster(), alice, password);
  EXPECT_EQ(key.use([&](std::uint32_t handle) { return must_touch(finger, handle); }),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_TRUE(tee.traced("Auth type mismatch"));
}

TEST_F(FingerKeyTest, ATouchIsGoodForAsLongAsTheKeySays) {
  guarded_key key(keymaster(), alice, finger_touch, 10);
  EXPECT_EQ(key.begin(), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_EQ(key.begin(must_touch(finger)), KM_ERROR_OK);
  advance(9'999);
  EXPECT_EQ(key.begin(), KM_ERROR_OK);
  advance(1);
  EXPECT_EQ(key.begin(), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
}

TEST_F(FingerKeyTest, ATokenThatWasChangedIsNone) {
  guarded_key key(keymaster(), alice, finger_touch, 10);
  const bytes token = must_touch(finger);
  for (std::size_t at = 0; at < token.size(); ++at) {
    EXPECT_EQ(key.begin(flip(token, at)), KM_ERROR_INVALID_ARGUMENT) << at;
  }
  EXPECT_EQ(key.begin(token), KM_ERROR_OK);
}

TEST_F(FingerKeyTest, ATokenOfBeforeTheRebootIsNone) {
  const bytes old = must_touch(finger);
  restart();
  guarded_key key(keymaster(), alice, finger_touch, 10);
  EXPECT_EQ(key.begin(old), KM_ERROR_INVALID_ARGUMENT);
  EXPECT_EQ(key.begin(must_touch(finger)), KM_ERROR_OK);
}

}  // namespace
}  // namespace testing_support
