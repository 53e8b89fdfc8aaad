// What the library asks of the Keymaster TA's attestation commands, and what it makes of the answers.
#include "client/lib/attestation.h"

#include "client/lib/wire.h"
#include "src/params/keymaster_defs.h"
#include "tests/client/attestation_key_file.h"
#include "tests/client/companion_fixture.h"

namespace {

using namespace keymaster;
using namespace keymaster::client;
using attestation_key_file::one_line_pem;

class AttestationClientTest : public companion_fixture {
 protected:
  void SetUp() override {
    companion_fixture::SetUp();
    ta.emplace(*tee);
  }
  void TearDown() override {
    ta.reset();
    companion_fixture::TearDown();
  }

  static void prepare_status(std::int32_t status) { prepare({.a = static_cast<std::uint32_t>(status)}); }

  /// Expects the refusal by status, and nothing taken for a result of the TEE's or for a Keymaster error.
  template <class Work>
  static void expect_status(const Work& work, const char* step, std::int32_t status) {
    prepare_status(status);
    const failure facts = failure_of(work);
    EXPECT_EQ(facts.kind, error_kind::soter) << step;
    EXPECT_EQ(facts.step, step);
    EXPECT_EQ(facts.soter_status, status);
    EXPECT_EQ(facts.tee_result, TEEC_SUCCESS);
    EXPECT_EQ(facts.keymaster_error, KM_ERROR_OK);
  }

  std::optional<session> ta;
};

TEST_F(AttestationClientTest, ReadinessAndVerificationAreAskedForWithEmptyWords) {
  ensure_ready(*ta);
  EXPECT_EQ(last().command, 0xFF00U);
  EXPECT_EQ(last().types, 0x0003U);
  verify_attk(*ta);
  EXPECT_EQ(last().command, 0xFF01U);
  EXPECT_EQ(last().types, 0x0003U);
  for (const fake_tee::arrival& one : fake_tee::now().arrivals) {
    EXPECT_EQ(one.a, 0U);
    EXPECT_EQ(one.b, 0U);
  }
}

TEST_F(AttestationClientTest, StatusesAreErrorsOfTheirOwnKind) {
  expect_status([&] { ensure_ready(*ta); }, "soter_generate_attk_key_pair", KM_ERROR_UNKNOWN_ERROR);
  expect_status([&] { verify_attk(*ta); }, "soter_verify_attk_key_pair", SOTER_STATUS_NO_ATTK);
  expect_status([&] { verify_attk(*ta); }, "soter_verify_attk_key_pair", SOTER_STATUS_UNREADABLE_ATTK);
  expect_status([&] { (void)export_attk(*ta); }, "soter_export_attk_public_key", SOTER_STATUS_NO_ATTK);
  expect_status([&] { (void)get_device_id(*ta); }, "soter_get_device_id", KM_ERROR_INSUFFICIENT_BUFFER_SPACE);
}

TEST_F(AttestationClientTest, AStatusIsToldByItsOwnNameAlthoughItsNumberIsAKeymasterErrorToo) {
  const auto text_of = [](const char* step, std::int32_t status) {
    return std::string(error({.kind = error_kind::soter, .step = step, .soter_status = status}).what());
  };
  EXPECT_EQ(text_of("soter_verify_attk_key_pair", -1),
            "soter_verify_attk_key_pair failed: TEE_SUCCESS, SOTER_STATUS_NO_ATTK (-1)");
  EXPECT_EQ(text_of("soter_verify_attk_key_pair", -2),
            "soter_verify_attk_key_pair failed: TEE_SUCCESS, SOTER_STATUS_UNREADABLE_ATTK (-2)");
  EXPECT_EQ(text_of("soter_get_device_id", -1000),
            "soter_get_device_id failed: TEE_SUCCESS, KM_ERROR_UNKNOWN_ERROR (-1000)");
}

TEST_F(AttestationClientTest, TheStateOfTheAttestationKeyIsToldWithoutThrowing) {
  EXPECT_EQ(get_attk_status(*ta), attk_status::present);
  prepare_status(SOTER_STATUS_NO_ATTK);
  EXPECT_EQ(get_attk_status(*ta), attk_status::absent);
  prepare_status(SOTER_STATUS_UNREADABLE_ATTK);
  EXPECT_EQ(get_attk_status(*ta), attk_status::unreadable);
  EXPECT_TRUE(is_ready(*ta));
  prepare_status(KM_ERROR_UNKNOWN_ERROR);
  EXPECT_FALSE(is_ready(*ta));
}

TEST_F(AttestationClientTest, ATaThatDiedIsNoStatus) {
  const fake_tee::answer dead{.result = TEEC_ERROR_TARGET_DEAD, .origin = TEEC_ORIGIN_TEE};
  for (const auto& work : std::vector<std::function<void()>>{
           [&] { (void)get_attk_status(*ta); }, [&] { (void)is_ready(*ta); }, [&] { (void)export_attk(*ta); }}) {
    prepare(dead);
    const failure facts = failure_of(work);
    EXPECT_EQ(facts.kind, error_kind::tee);
    EXPECT_EQ(facts.tee_result, TEEC_ERROR_TARGET_DEAD);
  }
}

bytes with_zero(const std::string& text) {
  bytes out(text.begin(), text.end());
  out.push_back(0);
  return out;
}

TEST_F(AttestationClientTest, TheAttestationKeyComesAsPemWithoutItsZero) {
  prepare({.body = with_zero(one_line_pem())});
  EXPECT_EQ(export_attk(*ta), one_line_pem());
  EXPECT_EQ(last().command, 0xFF02U);
  EXPECT_EQ(last().types, 0x0602U);
  EXPECT_GE(last().capacity, 445U);
}

TEST_F(AttestationClientTest, WhatIsNoSuchPemIsAFormatError) {
  std::string without_end = one_line_pem();
  without_end.pop_back();
  const std::string pem = one_line_pem();
  const std::vector<bytes> answers = {{},
                                      {0},
                                      {pem.begin(), pem.end()},
                                      with_zero(pem + std::string(1, '\0')),
                                      with_zero(without_end),
                                      with_zero("-----BEGIN PUBLIC KEY-----\nAAAA\n-----END PUBLIC KEY-----"),
                                      bytes(5000, 'x')};
  for (const bytes& answer : answers) {
    prepare({.body = answer});
    EXPECT_THROW((void)export_attk(*ta), format_error) << answer.size();
  }
}

TEST_F(AttestationClientTest, TheDevicesIdHasRoomFor64Bytes) {
  const bytes id(32, 0xD1);
  prepare({.body = id});
  EXPECT_EQ(get_device_id(*ta), id);
  EXPECT_EQ(last().command, 0xFF03U);
  EXPECT_EQ(last().types, 0x0602U);
  EXPECT_EQ(last().capacity, 64U);
  EXPECT_THROW((void)get_device_id(*ta), format_error) << "an empty id";
}

}  // namespace
