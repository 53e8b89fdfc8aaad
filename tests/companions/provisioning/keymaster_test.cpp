// What the Keymaster TA makes of what the provisioning TA keeps: both images, on one device.
#include "tests/companions/provisioning/provisioning_fixture.h"
#include "tests/companions/provisioning/reference_box.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

constexpr std::uint32_t values = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, 0, 0, 0);
constexpr std::uint32_t with_response = TEEC_PARAM_TYPES(TEEC_VALUE_OUTPUT, 0, TEEC_MEMREF_TEMP_OUTPUT, 0);

class KeymasterTest : public ProvisioningTest {
 protected:
  void put_properties() {
    ASSERT_EQ(put_property(from_hex(soter_property), soter_property_box(fingerprint_ta)), TEE_SUCCESS);
    ASSERT_EQ(put_property(from_hex(cpu_id_property), from_text("CPU0123")), TEE_SUCCESS);
    ASSERT_EQ(put_property(from_hex(device_id_property), pattern(32)), TEE_SUCCESS);
  }
  answer load() { return keymaster().call_types(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR, values, 0, 0, {}, 0); }
  answer verify() { return keymaster().call_types(KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR, values, 0, 0, {}, 0); }
  answer public_key(std::size_t capacity = 1024) {
    return keymaster().call_types(KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, with_response, 0, 0, {}, capacity);
  }
  answer device_id(std::size_t capacity = 64) {
    return keymaster().call_types(KM_COMMAND_SOTER_GET_DEVICE_ID, with_response, 0, 0, {}, capacity);
  }
  static void expect_status(const answer& got, std::int32_t status) {
    EXPECT_EQ(got.result, TEEC_SUCCESS);
    EXPECT_EQ(got.error, status);
  }
};

TEST_F(KeymasterTest, ItLoadsAGeneratedKeyAndAnswersItsPublicHalfAsThePemOfTheSameDer) {
  put_properties();
  const quil_answer made = generate();
  ASSERT_EQ(made.result, TEE_SUCCESS);
  expect_status(verify(), SOTER_STATUS_OK);
  expect_status(load(), SOTER_STATUS_OK);
  const answer pem = public_key();
  expect_status(pem, SOTER_STATUS_OK);
  ASSERT_EQ(pem.size, 445U);
  EXPECT_EQ(spki_of_pem(pem.body()), made.data());
}

TEST_F(KeymasterTest, ItLoadsAKeyThatWasPutInBothOfItsForms) {
  put_properties();
  const rsa_test_key& key = rsa_test_key::of_bits(2048);
  for (const std::size_t components : {std::size_t{8}, std::size_t{3}}) {
    ASSERT_EQ(put_key(attestation_key_box(key.components(), components)), TEE_SUCCESS);
    tee.close_session();
    tee.open_session();
    expect_status(verify(), SOTER_STATUS_OK);
    const answer pem = public_key();
    expect_status(pem, SOTER_STATUS_OK);
    EXPECT_EQ(spki_of_pem(pem.body()), key.spki());
  }
}

TEST_F(KeymasterTest, ItLoadsTheSameKeyAfterALockAndAReboot) {
  put_properties();
  const quil_answer made = generate();
  ASSERT_EQ(lock(), TEE_SUCCESS);
  restart();
  expect_status(load(), SOTER_STATUS_OK);
  EXPECT_EQ(spki_of_pem(public_key().body()), made.data());
}

TEST_F(KeymasterTest, ItKeepsAKeyThatItHasLoadedUntilItsLastSessionEnds) {
  put_properties();
  const quil_answer first = generate();
  expect_status(load(), SOTER_STATUS_OK);
  const quil_answer second = generate();
  EXPECT_EQ(spki_of_pem(public_key().body()), first.data());
  tee.close_session();
  tee.open_session();
  EXPECT_EQ(spki_of_pem(public_key().body()), second.data());
}

TEST_F(KeymasterTest, WithoutAKeyItSaysSo) {
  put_properties();
  expect_status(verify(), SOTER_STATUS_NO_ATTK);
  expect_status(load(), KM_ERROR_UNKNOWN_ERROR);
  const answer pem = public_key();
  expect_status(pem, SOTER_STATUS_NO_ATTK);
  EXPECT_EQ(pem.size, 0U);
}

TEST_F(KeymasterTest, WithoutAnyOneOfThePropertiesThatStatementsNeedItLoadsNothing) {
  ASSERT_EQ(put_key(attestation_key_box(rsa_test_key::of_bits(2048).components())), TEE_SUCCESS);
  expect_status(verify(), SOTER_STATUS_OK);
  expect_status(load(), KM_ERROR_UNKNOWN_ERROR);
  ASSERT_EQ(put_property(from_hex(soter_property), soter_property_box(fingerprint_ta)), TEE_SUCCESS);
  expect_status(load(), KM_ERROR_UNKNOWN_ERROR);
  ASSERT_EQ(put_property(from_hex(cpu_id_property), from_text("CPU0123")), TEE_SUCCESS);
  expect_status(load(), SOTER_STATUS_OK);
}

TEST_F(KeymasterTest, ItAnswersTheDeviceId) {
  expect_status(device_id(), KM_ERROR_UNKNOWN_ERROR);
  for (const std::size_t size : {std::size_t{16}, std::size_t{32}}) {
    ASSERT_EQ(put_property(from_hex(device_id_property), pattern(size)), TEE_SUCCESS);
    const answer got = device_id();
    expect_status(got, KM_ERROR_OK);
    EXPECT_EQ(got.body(), pattern(size));
  }
}

TEST_F(KeymasterTest, ADeviceIdThatDoesNotFitIsNotAnswered) {
  ASSERT_EQ(put_property(from_hex(device_id_property), pattern(32)), TEE_SUCCESS);
  const answer got = device_id(31);
  expect_status(got, KM_ERROR_INSUFFICIENT_BUFFER_SPACE);
  EXPECT_EQ(got.output, bytes(31, canary));
}

TEST_F(KeymasterTest, ItLeavesNoSessionOpen) {
  put_properties();
  ASSERT_EQ(put_key(attestation_key_box(rsa_test_key::of_bits(2048).components())), TEE_SUCCESS);
  const hosted_tee::accounting before = holdings(), keymaster_before = tee.accounting();
  expect_status(verify(), SOTER_STATUS_OK);
  expect_status(device_id(), KM_ERROR_OK);
  expect_same_holdings(before);
  EXPECT_TRUE(tee.accounting().same_holdings(keymaster_before));
}

}  // namespace
}  // namespace testing_support
