// A touch: the token that it yields, and what the Keymaster TA is told.
#include "tests/commands/hostile/freed_memory.h"
#include "tests/companions/fingerprint/fingerprint_fixture.h"
#include "tests/support/issued_token.h"

using namespace keymaster;

namespace testing_support {
namespace {

using ::testing::IsEmpty;

constexpr std::uint64_t alice = 0x1122334455667788, bob = 0xFFEEDDCCBBAA9988;

class TouchTest : public FingerprintTest {
 protected:
  const std::uint32_t finger = must_enrol(alice);

  bytes expected(std::uint64_t user, std::uint64_t challenge) {
    return issued_token{.challenge = challenge,
                        .user_id = user,
                        .authenticator_id = authenticator_id(),
                        .authenticator_type = 2,
                        .timestamp_ms = now_ms()}
        .issue(tee.world().boot_seed());
  }
};

TEST_F(TouchTest, YieldsTheTokenOfTheFingersUser) {
  const std::uint32_t other = must_enrol(bob);
  const std::uint64_t challenge = 0x0123456789ABCDEF;
  const bytes of_bob = must_touch(other, challenge), of_alice = must_touch(finger, challenge);
  EXPECT_EQ(to_hex(of_bob), to_hex(expected(bob, challenge)));
  EXPECT_EQ(to_hex(of_alice), to_hex(expected(alice, challenge)));
}

TEST_F(TouchTest, HasEachFieldInItsPlace) {
  const bytes token = must_touch(finger, 0xA1A2A3A4A5A6A7A8);
  ASSERT_EQ(token.size(), 69U);
  EXPECT_EQ(to_hex({token.begin(), token.begin() + 17}), "00a8a7a6a5a4a3a2a18877665544332211");
  EXPECT_EQ(bytes(token.begin() + 17, token.begin() + 25), stored("fp.authid"));
  // 7200.250 s after boot, in milliseconds
  EXPECT_EQ(to_hex({token.begin() + 25, token.begin() + 37}), "0000000200000000006dddfa");
  const auto seed = tee.world().boot_seed();
  EXPECT_EQ(bytes(token.begin() + 37, token.end()),
            hmac_sha256_of({seed.begin(), seed.end()}, {token.begin(), token.begin() + 37}));
}

TEST_F(TouchTest, IsStampedWithTheMomentOfTheTouch) {
  const bytes early = must_touch(finger);
  EXPECT_EQ(early, must_touch(finger));
  advance(1);
  const bytes late = must_touch(finger);
  EXPECT_NE(late, early);
  EXPECT_EQ(to_hex(late), to_hex(expected(alice, 0)));
}

TEST_F(TouchTest, NamesTheSameAuthenticatorForEver) {
  const bytes before = must_touch(finger);
  const std::uint64_t id = authenticator_id();
  EXPECT_NE(id, 0U);
  restart();
  const bytes after = must_touch(finger);
  EXPECT_EQ(authenticator_id(), id);
  EXPECT_NE(after, before);  // by the seed of the boot alone
  EXPECT_EQ(to_hex(after), to_hex(expected(alice, 0)));
}

TEST_F(TouchTest, OfADeviceWithoutPropertiesIsToldAndRefused) {
  tee.clear_trace();
  const touch_answer got = touch(finger);
  EXPECT_EQ(got.result, TEE_SUCCESS);
  EXPECT_EQ(got.size, 69U);
  EXPECT_EQ(got.told, TEE_ERROR_ACCESS_DENIED);
  EXPECT_THAT(errors(), ::testing::ElementsAre("The Keymaster TA answered 0xffff0001\n"));
  EXPECT_TRUE(tee.traced("soter deny finger print ta"));
}

TEST_F(TouchTest, TellsNobodyOfAnUnknownFinger) {
  tee.clear_trace();
  faults().clear();
  expect_refused(TEE_ERROR_ITEM_NOT_FOUND, {"No finger 2\n"}, [&] {
    const touch_answer got = touch(2);
    EXPECT_EQ(got.size, 0U);
    EXPECT_EQ(got.token, bytes(69, canary));
    EXPECT_EQ(got.told, 0U);
    return got.result;
  });
  EXPECT_EQ(faults().call_count("TEE_OpenTASession"), 0U);
}

TEST_F(TouchTest, TellsInASessionOfItsOwnWhichItCloses) {
  tee.close_session();  // of the Keymaster TA's only client
  EXPECT_EQ(touch(finger).told, TEE_ERROR_ACCESS_DENIED);
  EXPECT_FALSE(tee.world().has_instance(keymaster_ta));
  EXPECT_EQ(faults().call_count("TEE_OpenTASession"), faults().call_count("TEE_CloseTASession"));
}

TEST_F(TouchTest, YieldsATokenWhateverBecomesOfTheNews) {
  const bytes token = must_touch(finger);
  for (const char* const call : {"TEE_OpenTASession", "TEE_InvokeTACommand"}) {
    const hosted_tee::accounting before = holdings();
    faults().fail_call(call, 1, TEE_ERROR_TARGET_DEAD);
    const touch_answer got = touch(finger);
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.token, token);
    EXPECT_EQ(got.told, TEE_ERROR_TARGET_DEAD);
    expect_same_holdings(before);
  }
}

TEST_F(TouchTest, LeavesNoSeedInFreedMemory) {
  freed_memory freed(tee.world());
  must_touch(finger);
  const auto seed = tee.world().boot_seed();
  EXPECT_GT(freed.blocks(), 0U);
  EXPECT_FALSE(freed.holds({seed.begin(), seed.end()}));
}

TEST_F(TouchTest, AnAuthenticatorIdThatIsNoneIsRefusedAndKept) {
  for (const std::size_t size : {0U, 7U, 9U}) {
    store("fp.authid", bytes(size));
    expect_refused(TEE_ERROR_BAD_STATE,
                   {"A stored object has " + std::to_string(size) + " bytes or more instead of 8\n"},
                   [&] { return touch(finger).result; });
  }
}

}  // namespace
}  // namespace testing_support
