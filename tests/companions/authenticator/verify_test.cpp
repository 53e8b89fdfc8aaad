// The right password yields a token; what else is asked for yields nothing.
#include "tests/companions/authenticator/authenticator_fixture.h"
#include "tests/support/issued_token.h"

using namespace keymaster::authenticator;

namespace testing_support {
namespace {

class VerifyTest : public AuthenticatorTest {
 protected:
  const password_answer enrolled = must_enrol(alice, right);
  const bytes handle = enrolled.output;

  bytes expected(std::uint64_t challenge) {
    const bytes id = stored("pwauth.authid").value_or(bytes(8));
    return issued_token{.challenge = challenge,
                        .user_id = enrolled.secure_id(),
                        .authenticator_id = u32_at(id, 0) | std::uint64_t{u32_at(id, 4)} << 32,
                        .authenticator_type = 1,
                        .timestamp_ms = now_ms()}
        .issue(tee.world().boot_seed());
  }
};

TEST_F(VerifyTest, TheRightPasswordYieldsTheUsersToken) {
  tee.clear_trace();
  const password_answer got = verify(alice, handle, right, 0x0123456789ABCDEF);
  EXPECT_EQ(got.result, TEE_SUCCESS);
  EXPECT_THAT(errors(), ::testing::IsEmpty());
  EXPECT_EQ(got.size, 69U);
  EXPECT_EQ(got.a, 0U);
  EXPECT_EQ(to_hex(got.output), to_hex(expected(0x0123456789ABCDEF)));
  EXPECT_EQ(failures(alice), record{});
}

TEST_F(VerifyTest, HasEachFieldInItsPlace) {
  const bytes token = must_verify(alice, handle, right, 0xA1A2A3A4A5A6A7A8);
  ASSERT_EQ(token.size(), 69U);
  EXPECT_EQ(to_hex({token.begin(), token.begin() + 9}), "00a8a7a6a5a4a3a2a1");
  EXPECT_EQ(bytes(token.begin() + 9, token.begin() + 17), u64(enrolled.secure_id()));
  EXPECT_EQ(bytes(token.begin() + 17, token.begin() + 25), stored("pwauth.authid"));
  EXPECT_EQ(to_hex({token.begin() + 25, token.begin() + 29}), "00000001");
  const auto seed = tee.world().boot_seed();
  EXPECT_EQ(bytes(token.begin() + 37, token.end()),
            hmac_sha256_of({seed.begin(), seed.end()}, {token.begin(), token.begin() + 37}));
}

TEST_F(VerifyTest, TheHandleOutlivesARestart) {
  const bytes id = (must_verify(alice, handle, right), *stored("pwauth.authid"));
  restart();
  EXPECT_EQ(to_hex(must_verify(alice, handle, right, 5)), to_hex(expected(5)));
  EXPECT_EQ(stored("pwauth.authid"), id);
  EXPECT_NE(id, bytes(8));
}

TEST_F(VerifyTest, AnyOtherPasswordIsDenied) {
  bytes longer = right, shorter = right;
  longer.push_back(0);
  shorter.pop_back();
  for (const bytes& other :
       {wrong, longer, shorter, flip(right, 0), bytes{}, bytes(1024), bytes(1025), bytes(70'000)}) {
    SCOPED_TRACE(other.size());
    expect_denied(alice, handle, other);
    set_failures(alice, {});
  }
}

TEST_F(VerifyTest, BytesOfEveryValueMakeAPassword) {
  bytes all(256);
  for (std::size_t i = 0; i < all.size(); ++i) all[i] = static_cast<std::uint8_t>(i);
  const bytes other = must_enrol(alice, all).output;
  must_verify(alice, other, all);
  expect_denied(alice, other, flip(all, 255));
}

TEST_F(VerifyTest, TheRightPasswordEndsARowOfFailures) {
  fail(alice, handle, 4);
  must_verify(alice, handle, right);
  EXPECT_EQ(failures(alice), record{});
  fail(alice, handle, 4);
  must_verify(alice, handle, right);
}

TEST_F(VerifyTest, NothingIsKeptOfAUserButTheFailures) {
  must_verify(alice, handle, right);
  const bytes key = *stored("pwauth.key");
  for (const auto& [name, content] : stored_now()) {
    if (!content || name == "pwauth.key") continue;
    EXPECT_LE(content->size(), 12U) << name;
  }
  EXPECT_EQ(key.size(), 32U);
}

}  // namespace
}  // namespace testing_support
