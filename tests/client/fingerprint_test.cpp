// What the library sends to the fingerprint TA, and what it makes of the answers.
#include "client/lib/fingerprint.h"

#include "client/lib/auth_token.h"
#include "client/lib/wire.h"
#include "tests/client/companion_fixture.h"

namespace {

using namespace keymaster::client;

constexpr std::uint32_t tee_error_overflow = 0xFFFF300F;

/// Version 0, challenge, secure id, authenticator id; then type and time with the highest byte first; then the MAC.
bytes some_token() {
  bytes token{0, 0x11, 0, 0, 0, 0,    0, 0, 0x80, 0x22, 0, 0, 0, 0, 0, 0, 0x90, 0x33, 0,
              0, 0,    0, 0, 0, 0xA0, 0, 0, 0,    2,    0, 0, 0, 0, 0, 0, 0x0E, 0x10};
  token.resize(69, 0xCC);
  return token;
}

class FingerprintClientTest : public companion_fixture {
 protected:
  void SetUp() override {
    companion_fixture::SetUp();
    sensor.emplace(*tee);
  }
  void TearDown() override {
    sensor.reset();
    companion_fixture::TearDown();
  }
  std::optional<fingerprint> sensor;
};

TEST_F(FingerprintClientTest, TheSessionIsOneWithTheFingerprintTa) {
  EXPECT_EQ(fake_tee::now().opened_tas, std::vector<std::uint32_t>{0xe8a03a08});
  fake_tee::now().absent_ta = 0xe8a03a08;
  const failure facts = failure_of([&] { const fingerprint absent(*tee); });
  EXPECT_EQ(facts.kind, error_kind::connection);
  EXPECT_EQ(facts.step, "open_fingerprint");
  EXPECT_EQ(facts.tee_result, TEEC_ERROR_ITEM_NOT_FOUND);
}

TEST_F(FingerprintClientTest, AFingerIsEnrolledForTheTwoHalvesOfAUsersId) {
  prepare({.slots = {{.slot = 1, .a = 7}}});
  EXPECT_EQ(sensor->enrol(0x1122334455667788), 7U);
  EXPECT_EQ(last().command, 1U);
  EXPECT_EQ(last().types, 0x0021U);
  EXPECT_EQ(last().slots[0].a, 0x55667788U);
  EXPECT_EQ(last().slots[0].b, 0x11223344U);
}

TEST_F(FingerprintClientTest, AFingerWithTheIdOfNoneIsAFormatError) {
  EXPECT_THROW((void)sensor->enrol(1), format_error);
}

TEST_F(FingerprintClientTest, ATouchYieldsATokenAndWhatTheKeymasterTaAnswered) {
  prepare({.body = some_token(), .slots = {{.slot = 3, .a = 0xFFFF0001}}});
  const touch_result touched = sensor->touch(7, 0x8000000000000011);
  EXPECT_EQ(touched.token, some_token());
  EXPECT_EQ(touched.keymaster_result, 0xFFFF0001U);
  EXPECT_EQ(last().command, 2U);
  EXPECT_EQ(last().types, 0x2611U);
  EXPECT_EQ(last().slots[0].a, 7U);
  EXPECT_EQ(last().slots[1].a, 0x11U);
  EXPECT_EQ(last().slots[1].b, 0x80000000U);
  EXPECT_EQ(last().slots[2].capacity, 69U);
}

TEST_F(FingerprintClientTest, WhatIsNoTokenIsAFormatError) {
  bytes of_another_version = some_token();
  of_another_version[0] = 1;
  for (const bytes& token : {bytes{}, bytes(68), bytes(70), of_another_version}) {
    prepare({.body = token});
    EXPECT_THROW((void)sensor->touch(7), format_error) << token.size();
  }
}

TEST_F(FingerprintClientTest, FingersAreListedAsTheyCome) {
  prepare(
      {.slots = {{.slot = 0, .body = {7, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0x80, 1, 0, 0, 0x10, 2, 0, 0, 0, 0, 0, 0, 0}}}});
  EXPECT_EQ(sensor->list(), (std::vector<finger>{{7, 0x8000000000000001}, {0x10000001, 2}}));
  EXPECT_EQ(last().command, 4U);
  EXPECT_EQ(last().types, 0x0006U);
  EXPECT_EQ(last().slots[0].capacity, 32U * 12U);
  prepare({.slots = {{.slot = 0}}});
  EXPECT_TRUE(sensor->list().empty());
}

TEST_F(FingerprintClientTest, AListThatEndsInTheMiddleOrIsTooLongIsAFormatError) {
  for (const std::size_t size : {1, 11, 13, 396}) {
    prepare({.slots = {{.slot = 0, .body = bytes(size)}}});
    EXPECT_THROW((void)sensor->list(), format_error) << size;
  }
}

TEST_F(FingerprintClientTest, AFingerIsRemovedByItsId) {
  sensor->remove(7);
  EXPECT_EQ(last().command, 3U);
  EXPECT_EQ(last().types, 0x0001U);
  EXPECT_EQ(last().slots[0].a, 7U);
}

TEST_F(FingerprintClientTest, EveryRefusalNamesItsStep) {
  const auto refuse = [](std::uint32_t result) { prepare({.result = result}); };
  refuse(tee_error_overflow);
  expect_refused([&] { (void)sensor->enrol(1); }, "enrol_finger", tee_error_overflow);
  refuse(TEEC_ERROR_ITEM_NOT_FOUND);
  expect_refused([&] { (void)sensor->touch(1); }, "touch_finger", TEEC_ERROR_ITEM_NOT_FOUND);
  refuse(TEEC_ERROR_ITEM_NOT_FOUND);
  expect_refused([&] { sensor->remove(1); }, "remove_finger", TEEC_ERROR_ITEM_NOT_FOUND);
  refuse(TEEC_ERROR_SHORT_BUFFER);
  expect_refused([&] { (void)sensor->list(); }, "list_fingers", TEEC_ERROR_SHORT_BUFFER);
}

TEST(AuthTokens, AreReadFieldByField) {
  const auth_token told = parse_auth_token(some_token());
  EXPECT_EQ(told.challenge, 0x8000000000000011U);
  EXPECT_EQ(told.secure_id, 0x9000000000000022U);
  EXPECT_EQ(told.authenticator_id, 0xA000000000000033U);
  EXPECT_EQ(told.type, 2U);
  EXPECT_EQ(told.timestamp_ms, 3600U);
}

}  // namespace
