// Which tokens are believed. All of them are minted here, with libcrypto.
#include "auth/auth_token.h"

#include <fmt/format.h>

#include "tests/auth/auth_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

constexpr token_fields some_token = {.challenge = 0x1122334455667788,
                                     .user_id = 0xA1A2A3A4A5A6A7A8,
                                     .authenticator_id = 0xB1B2B3B4B5B6B7B8,
                                     .type = 0x01020304,
                                     .timestamp = 0x0000001122334455};

class AuthTokenTest : public AuthTest {
 protected:
  int check(const bytes& token) {
    ta.clear_trace();
    return check_auth_token_valid(token.data(), static_cast<std::uint32_t>(token.size()));
  }

  /// The token with its MAC replaced by zeros, as a forger without the secret would try.
  [[nodiscard]] bytes zero_mac_token() const {
    bytes token = mint(some_token);
    std::fill(token.begin() + 37, token.end(), std::uint8_t{0});
    return token;
  }
};

TEST_F(AuthTokenTest, ATokenOfTheAuthenticatorsIsValid) {
  const auto before = ta.holdings();
  EXPECT_EQ(check(mint(some_token)), 0);
  EXPECT_EQ(check(mint({})), 0);
  EXPECT_THAT(ta.errors(), IsEmpty());
  expect_same(ta.holdings(), before);
}

TEST_F(AuthTokenTest, TheFieldsStandWhereTheAuthenticatorPutsThem) {
  const bytes token = mint(some_token);
  EXPECT_EQ(to_hex(std::span(token).first(37)),
            "00"
            "8877665544332211"
            "a8a7a6a5a4a3a2a1"
            "b8b7b6b5b4b3b2b1"
            "01020304"
            "0000001122334455");
  const auth_token_fields fields = parse_auth_token(std::span<const std::uint8_t, auth_token_size>{token});
  EXPECT_EQ(fields.challenge, some_token.challenge);
  EXPECT_EQ(fields.user_id, some_token.user_id);
  EXPECT_EQ(fields.authenticator_id, some_token.authenticator_id);
  EXPECT_EQ(fields.authenticator_type, some_token.type);
  EXPECT_EQ(fields.timestamp, some_token.timestamp);
}

TEST_F(AuthTokenTest, ATokenOfAnotherSizeIsInvalidWhateverItHolds) {
  for (const std::size_t size : {0U, 1U, 37U, 68U, 70U, 138U}) {
    bytes token = mint(some_token);
    token.resize(size);
    if (size > 0) token[0] = 9;  // a wrong version too: the size is looked at first
    EXPECT_EQ(check(token), 1);
    EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("Wrong auth token size, expected 69B, got {}B", size)));
  }
  EXPECT_EQ(check_auth_token_valid(nullptr, 0), 1);
  EXPECT_EQ(ta.faults().call_count("TEE_AllocateOperation"), 0U);
}

TEST_F(AuthTokenTest, ATokenOfAnotherVersionIsInvalidEvenWhenItsMacVerifies) {
  for (std::uint32_t version = 1; version < 256; ++version) {
    token_fields fields = some_token;
    fields.version = static_cast<std::uint8_t>(version);
    EXPECT_EQ(check(mint(fields)), 1);
    EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("Wrong auth token version, expected 0, got {}", version)));
  }
  EXPECT_EQ(ta.faults().call_count("TEE_AllocateOperation"), 0U);
}

TEST_F(AuthTokenTest, ATokenOfAnotherBootIsInvalid) {
  EXPECT_EQ(check(some_token.mint(pattern(32, 78))), 1);
  EXPECT_EQ(check(some_token.mint(bytes(32, 0))), 1);
  EXPECT_THAT(ta.errors(), IsEmpty()) << "nothing is traced of a MAC that does not verify";
}

TEST_F(AuthTokenTest, TheSeedOfTheNextBootEndsAllTokens) {
  const bytes token = mint(some_token);
  device.boot_seed[5] ^= 1;
  restart(start_system, start_ree);
  EXPECT_EQ(check(token), 1);
  EXPECT_EQ(check(mint(some_token)), 0);
}

TEST_F(AuthTokenTest, EveryBitOfATokenCounts) {
  const bytes token = mint(some_token);
  for (std::size_t at = 0; at < token.size(); ++at) {
    for (int bit = 0; bit < 8; ++bit) {
      bytes changed = token;
      changed[at] = static_cast<std::uint8_t>(changed[at] ^ (1 << bit));
      EXPECT_EQ(check(changed), 1) << at << " " << bit;
      EXPECT_EQ(ta.errors().empty(), at != 0) << "only the version has a message";
    }
  }
}

TEST_F(AuthTokenTest, AZeroMacIsInvalid) {
  EXPECT_EQ(check(zero_mac_token()), 1);
}

TEST_F(AuthTokenTest, AZeroMacStaysInvalidWhenThePlatformCannotComputeOne) {
  // On such a failure the computed MAC is cleared, and would equal the forger's.
  struct row {
    const char* call;
    const char* line;
  };
  for (const row& r : {row{"TEE_AllocateOperation", "AllocateOperation failed with 0xffff000c\n"},
                       {"TEE_SetOperationKey", "SetOperationKey failed with 0xffff000c\n"},
                       {"TEE_MACComputeFinal", "MACComputeFinal failed with 0xffff000c\n"}}) {
    const auto before = ta.holdings();
    ta.faults().fail_call(r.call, 1, TEE_ERROR_OUT_OF_MEMORY);
    EXPECT_EQ(check(zero_mac_token()), 1) << r.call;
    EXPECT_TRUE(ta.faults().triggered());
    EXPECT_THAT(ta.errors(), ElementsAre(r.line));
    expect_same(ta.holdings(), before);
    ta.faults().clear();
  }
}

TEST_F(AuthTokenTest, AValidTokenIsInvalidWhileThePlatformCannotComputeItsMac) {
  for (const char* const call : {"TEE_AllocateOperation", "TEE_SetOperationKey", "TEE_MACComputeFinal"}) {
    ta.faults().fail_call(call, 1, TEE_ERROR_BUSY);
    EXPECT_EQ(check(mint(some_token)), 1) << call;
    EXPECT_EQ(check(mint(some_token)), 0) << "the next call works";
  }
}

TEST_F(AuthTokenTest, AMacOfAnotherLengthMakesEveryTokenInvalid) {
  for (const std::uint32_t length : {0U, 20U, 31U, 33U, 64U, 256U}) {
    for (const bytes& token : {mint(some_token), zero_mac_token()}) {
      ta.faults().override_output("TEE_MACComputeFinal", 1,
                                  [length](std::uint32_t* reported, TEE_Result&) { *reported = length; });
      EXPECT_EQ(check(token), 1) << length;
      EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("Wrong MAC length, expected 32B, got {}B\n", length)));
    }
  }
}

}  // namespace
