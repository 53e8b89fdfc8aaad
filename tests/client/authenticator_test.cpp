// What the library sends to the password authenticator, and what it makes of the answers.
#include "client/lib/authenticator.h"

#include "client/kmctl/values.h"
#include "client/lib/wire.h"
#include "tests/client/companion_fixture.h"

namespace {

using namespace keymaster::client;
using kmctl::parse_hex;

class AuthenticatorClientTest : public companion_fixture {
 protected:
  void SetUp() override {
    companion_fixture::SetUp();
    passwords.emplace(*tee);
  }
  void TearDown() override {
    passwords.reset();
    companion_fixture::TearDown();
  }
  std::optional<authenticator> passwords;
  const byte_view password = as_bytes("swordfish");
  const bytes handle = bytes(61, 0x61);
};

TEST_F(AuthenticatorClientTest, TheSessionIsOneWithTheAuthenticator) {
  EXPECT_EQ(fake_tee::now().opened_tas, std::vector<std::uint32_t>{0xc45dc7dc});
  fake_tee::now().absent_ta = 0xc45dc7dc;
  const failure facts = failure_of([&] { const authenticator absent(*tee); });
  EXPECT_EQ(facts.kind, error_kind::connection);
  EXPECT_EQ(facts.step, "open_authenticator");
}

TEST_F(AuthenticatorClientTest, ANewUserSendsNothingButTheNewPassword) {
  prepare({.body = handle, .slots = {{.slot = 3, .a = 0x55667788, .b = 0x11223344}}});
  const enrolment enrolled = passwords->enrol(1000, password);
  EXPECT_EQ(enrolled.handle, handle);
  EXPECT_EQ(enrolled.secure_id, 0x1122334455667788U);
  EXPECT_EQ(last().command, 1U);
  EXPECT_EQ(last().types, 0x2651U);
  EXPECT_EQ(last().slots[0].a, 1000U);
  EXPECT_EQ(last().slots[1].data, parse_hex("0000000000000000"
                                            "09000000"
                                            "73776f726466697368"));
  EXPECT_EQ(last().slots[2].capacity, 61U);
}

TEST_F(AuthenticatorClientTest, AChangedPasswordGoesWithThePresentHandleAndPassword) {
  prepare({.body = handle, .slots = {{.slot = 3, .a = 1}}});
  const bytes old_handle{1, 2, 3};
  (void)passwords->enrol(1000, password, present_password{.handle = old_handle, .password = as_bytes("old")});
  EXPECT_EQ(last().slots[1].data, parse_hex("03000000"
                                            "010203"
                                            "03000000"
                                            "6f6c64"
                                            "09000000"
                                            "73776f726466697368"));
}

TEST_F(AuthenticatorClientTest, AHandleOfAnotherSizeOrASecureIdOfNobodyIsAFormatError) {
  for (const std::size_t size : {0, 60, 62}) {
    prepare({.body = bytes(size), .slots = {{.slot = 3, .a = 1}}});
    EXPECT_THROW((void)passwords->enrol(1, password), format_error) << size;
  }
  prepare({.body = handle});
  EXPECT_THROW((void)passwords->enrol(1, password), format_error);
}

TEST_F(AuthenticatorClientTest, APasswordBecomesATokenForAChallenge) {
  bytes token(69);
  token[68] = 0xCC;
  prepare({.body = token});
  EXPECT_EQ(passwords->verify(1000, 0x8000000000000011, bytes{1, 2, 3}, password), token);
  EXPECT_EQ(last().command, 2U);
  EXPECT_EQ(last().types, 0x0653U);
  EXPECT_EQ(last().slots[0].a, 1000U);
  EXPECT_EQ(last().slots[1].data, parse_hex("1100000000000080"
                                            "03000000"
                                            "010203"
                                            "09000000"
                                            "73776f726466697368"));
  EXPECT_EQ(last().slots[2].capacity, 69U);
}

TEST_F(AuthenticatorClientTest, WhatIsNoTokenIsAFormatError) {
  for (const std::size_t size : {0, 68, 70}) {
    prepare({.body = bytes(size)});
    EXPECT_THROW((void)passwords->verify(1, 0, handle, password), format_error) << size;
  }
}

TEST_F(AuthenticatorClientTest, AWrongPasswordIsARefusalWithoutAWait) {
  prepare({.a = 12345, .result = TEEC_ERROR_ACCESS_DENIED});
  const auto verify = [&] { (void)passwords->verify(1, 0, handle, password); };
  expect_refused(verify, "verify_password", TEEC_ERROR_ACCESS_DENIED);
  prepare({.a = 12345, .result = TEEC_ERROR_ACCESS_DENIED});
  EXPECT_EQ(failure_of(verify).wait_ms, 0U);
  prepare({.result = TEEC_ERROR_BAD_PARAMETERS});
  expect_refused([&] { (void)passwords->enrol(1, {}); }, "enrol_password", TEEC_ERROR_BAD_PARAMETERS);
}

TEST_F(AuthenticatorClientTest, TooManyFailuresTellForHowLong) {
  prepare({.a = 29999, .result = TEEC_ERROR_BUSY});
  EXPECT_EQ(failure_of([&] { (void)passwords->verify(1, 0, handle, password); }).wait_ms, 29999U);
  prepare({.result = TEEC_ERROR_BUSY, .slots = {{.slot = 3, .a = 60000}}});
  try {
    (void)passwords->enrol(1, password);
    FAIL();
  } catch (const error& refused) {
    EXPECT_STREQ(refused.what(), "enrol_password failed: TEE_ERROR_BUSY from TRUSTED_APP, wait 60000 ms");
    EXPECT_NE(refused.hint().find("until the time has passed"), std::string::npos);
  }
}

TEST_F(AuthenticatorClientTest, ABusyTeeTellsNoWait) {
  prepare({.a = 29999, .result = TEEC_ERROR_BUSY, .origin = TEEC_ORIGIN_TEE});
  EXPECT_EQ(failure_of([&] { (void)passwords->verify(1, 0, handle, password); }).wait_ms, 0U);
}

}  // namespace
