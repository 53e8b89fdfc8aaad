// Keys that a password unlocks.
#include "tests/companions/authenticator/authenticator_fixture.h"
#include "tests/companions/guarded_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t password = 1, finger_touch = 2;

class PasswordKeyTest : public AuthenticatorTest {
 protected:
  const password_answer enrolled = must_enrol(alice, right);
  const bytes handle = enrolled.output;
  const std::uint64_t secure_id = enrolled.secure_id();
};

TEST_F(PasswordKeyTest, ThePasswordForTheOperationUnlocksIt) {
  guarded_key key(keymaster(), secure_id, password);
  EXPECT_EQ(key.use([&](std::uint32_t op) { return must_verify(alice, handle, right, op); }), KM_ERROR_OK);
}

TEST_F(PasswordKeyTest, AnEitherOrKeyTakesThePassword) {
  guarded_key key(keymaster(), secure_id, password | finger_touch);
  EXPECT_EQ(key.use([&](std::uint32_t op) { return must_verify(alice, handle, right, op); }), KM_ERROR_OK);
}

TEST_F(PasswordKeyTest, ThePasswordForAnotherOperationDoesNot) {
  guarded_key key(keymaster(), secure_id, password);
  EXPECT_EQ(key.use([&](std::uint32_t op) { return must_verify(alice, handle, right, std::uint64_t{op} + 1); }),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_TRUE(tee.traced("Challenge mismatch"));
}

TEST_F(PasswordKeyTest, AnotherUsersPasswordDoesNot) {
  guarded_key key(keymaster(), secure_id, password);
  const bytes of_bob = must_enrol(bob, right).output;
  EXPECT_EQ(key.use([&](std::uint32_t op) { return must_verify(bob, of_bob, right, op); }),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_TRUE(tee.traced("User id mismatch"));
}

TEST_F(PasswordKeyTest, AKeyThatWantsAFingerTakesNoPassword) {
  guarded_key key(keymaster(), secure_id, finger_touch);
  EXPECT_EQ(key.use([&](std::uint32_t op) { return must_verify(alice, handle, right, op); }),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_TRUE(tee.traced("Auth type mismatch"));
}

/// Nobody has the secure id 0, and no authenticator may answer to it.
TEST_F(PasswordKeyTest, AKeyOfNobodyTakesNoPassword) {
  guarded_key key(keymaster(), 0, password);
  EXPECT_EQ(key.use([&](std::uint32_t op) { return must_verify(alice, handle, right, op); }),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
}

TEST_F(PasswordKeyTest, ThePasswordIsGoodForAsLongAsTheKeySays) {
  guarded_key key(keymaster(), secure_id, password, 10);
  EXPECT_EQ(key.begin(), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_EQ(key.begin(must_verify(alice, handle, right)), KM_ERROR_OK);
  advance(9'999);
  EXPECT_EQ(key.begin(), KM_ERROR_OK);
  advance(1);
  EXPECT_EQ(key.begin(), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_EQ(key.begin(must_verify(alice, handle, right)), KM_ERROR_OK);
}

TEST_F(PasswordKeyTest, ATokenThatWasChangedIsNone) {
  guarded_key key(keymaster(), secure_id, password, 10);
  const bytes token = must_verify(alice, handle, right);
  for (std::size_t at = 0; at < token.size(); ++at) {
    EXPECT_EQ(key.begin(flip(token, at)), KM_ERROR_INVALID_ARGUMENT) << at;
  }
  EXPECT_EQ(key.begin(token), KM_ERROR_OK);
}

TEST_F(PasswordKeyTest, AKeyOutlivesTheChangeOfThePassword) {
  guarded_key key(keymaster(), secure_id, password);
  const bytes second = from_text("battery staple");
  const password_answer changed = enrol(alice, second, handle, right);
  ASSERT_EQ(changed.result, TEE_SUCCESS);
  EXPECT_EQ(key.use([&](std::uint32_t op) { return must_verify(alice, changed.output, second, op); }), KM_ERROR_OK);
}

TEST_F(PasswordKeyTest, AnEnrolmentAnewDoesNotOpenTheKey) {
  guarded_key key(keymaster(), secure_id, password);
  const bytes second = from_text("battery staple"), fresh = must_enrol(alice, second).output;
  EXPECT_EQ(key.use([&](std::uint32_t op) { return must_verify(alice, fresh, second, op); }),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
}

TEST_F(PasswordKeyTest, ATokenOfBeforeTheRebootIsNone) {
  const bytes old = must_verify(alice, handle, right);
  restart();
  guarded_key key(keymaster(), secure_id, password, 10);
  EXPECT_EQ(key.begin(old), KM_ERROR_INVALID_ARGUMENT);
  EXPECT_EQ(key.begin(must_verify(alice, handle, right)), KM_ERROR_OK);
}

}  // namespace
}  // namespace testing_support
