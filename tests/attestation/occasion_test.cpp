// What a statement says of its occasion: the finger that touched, and the counter that never stands still.
#include "tests/attestation/attested_device.h"

using namespace keymaster;

namespace testing_support {
namespace {

class AttestationOccasionTest : public AttestationTest {
 protected:
  bytes blob = soter_key(1024, param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK).add(KM_TAG_SOTER_COUNTED));

  nlohmann::ordered_json sign(std::string_view raw = "raw") { return signed_statement(blob, pkcs1, raw, 128).json(); }
  void make_ready() { ASSERT_EQ(soter_command(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR), SOTER_STATUS_OK); }
};

TEST_F(AttestationOccasionTest, ATouchHoldsForThreeSecondsAndForEveryStatementWithinThem) {
  make_ready();
  const std::uint32_t finger = enrol_finger();
  EXPECT_EQ(touch(finger).noticed, TEE_SUCCESS);
  EXPECT_EQ(sign()["fid"], finger);
  tee.world().clock().advance(3000);
  EXPECT_EQ(sign()["fid"], finger);
  tee.world().clock().advance(1);
  EXPECT_FALSE(sign().contains("fid"));
  EXPECT_TRUE(tee.traced("get finger id error ffff3001, continue without fid\n", hosted_tee::trace_level::info));
}

TEST_F(AttestationOccasionTest, WithoutATouchThereIsNoFinger) {
  make_ready();
  (void)enrol_finger();
  EXPECT_FALSE(sign().contains("fid"));
}

TEST_F(AttestationOccasionTest, TheLatestTouchCounts) {
  make_ready();
  const std::uint32_t one = enrol_finger(), other = enrol_finger();
  ASSERT_NE(one, other);
  EXPECT_EQ(touch(one).noticed, TEE_SUCCESS);
  EXPECT_EQ(touch(other).noticed, TEE_SUCCESS);
  EXPECT_EQ(sign()["fid"], other);
}

TEST_F(AttestationOccasionTest, ATouchBeforeThePropertiesAreLoadedIsRefusedAndYieldsATokenStill) {
  const std::uint32_t finger = enrol_finger();
  tee.clear_trace();
  const touched early = touch(finger);
  EXPECT_EQ(early.result, TEE_SUCCESS);
  EXPECT_EQ(early.noticed, TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(early.token.at(0), 0);
  EXPECT_TRUE(tee.traced("soter deny finger print ta"));
  EXPECT_FALSE(sign().contains("fid"));
  EXPECT_EQ(touch(finger).noticed, TEE_SUCCESS);  // that signature loaded them
  EXPECT_EQ(sign()["fid"], finger);
}

TEST_F(AttestationOccasionTest, ATouchIsForgottenWithTheInstance) {
  make_ready();
  const std::uint32_t finger = enrol_finger();
  EXPECT_EQ(touch(finger).noticed, TEE_SUCCESS);
  tee.close_session();
  EXPECT_EQ(touch(finger).noticed, TEE_ERROR_ACCESS_DENIED);  // told to an instance that ends with the notice
  tee.open_session();
  EXPECT_FALSE(sign().contains("fid"));
}

TEST_F(AttestationOccasionTest, AFingerThatIsNotEnrolledTellsNobody) {
  make_ready();
  const touched stranger = touch(77);
  EXPECT_EQ(stranger.result, TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_FALSE(sign().contains("fid"));
}

TEST_F(AttestationOccasionTest, OneCounterServesAllStatementsAndOutlivesTheDevicesSleep) {
  EXPECT_EQ(exported(blob, attk_size).json()["counter"], 1);
  EXPECT_EQ(sign()["counter"], 2);
  const bytes uncounted = soter_key(1024, param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK));
  EXPECT_FALSE(exported(uncounted, attk_size).json().contains("counter"));
  tee.close_session();
  tee.open_session();
  EXPECT_EQ(sign()["counter"], 3);
  tee.restart();
  EXPECT_EQ(exported(blob, attk_size).json()["counter"], 4);
  EXPECT_EQ(stored_counter(), 4U);
}

TEST_F(AttestationOccasionTest, AMessageThatIsNoTextCostsNoCounterValueAndAFailedExportCostsOne) {
  EXPECT_EQ(sign()["counter"], 1);
  for (const bytes& raw : {from_hex("610062"), from_hex("61ff"), from_hex("eda080"), from_hex("00")}) {
    const hosted_tee::accounting before = tee.accounting();
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1);
    EXPECT_TRUE(client().update(handle, raw).ok());
    const finish_answer refused = client().finish(handle);
    EXPECT_EQ(refused.result, TEEC_SUCCESS);
    EXPECT_EQ(refused.error, KM_ERROR_UNKNOWN_ERROR);
    EXPECT_TRUE(tee.traced("soter enhance error ffff0005"));
    expect_same(before);
  }
  EXPECT_EQ(stored_counter(), 1U);
  const answer cut = client().export_key(blob, {}, {}, 300);
  EXPECT_EQ(cut.result, TEEC_ERROR_SHORT_BUFFER);
  EXPECT_EQ(cut.error, KM_ERROR_UNKNOWN_ERROR);
  EXPECT_EQ(stored_counter(), 2U);
  EXPECT_EQ(sign()["counter"], 3);
}

TEST_F(AttestationOccasionTest, AKeyThatSignsWithoutADigestMakesNoStatementAndMovesNothing) {
  const param_list bare = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const finish_answer refused = client().sign(blob, bare, from_text("raw"));
  EXPECT_EQ(refused.result, TEEC_SUCCESS);
  EXPECT_EQ(refused.error, KM_ERROR_UNKNOWN_ERROR);
  EXPECT_TRUE(tee.traced("soter enhance error ffff000a"));
  EXPECT_FALSE(stored_counter().has_value());
}

TEST_F(AttestationOccasionTest, ACounterOfTwelveDigitsIsRefusedAndNeverCut) {
  const auto store = [&](std::uint64_t counter) {
    const bytes image = u64(counter);
    const std::string data(image.begin(), image.end());
    tee.world().write_object(keymaster_ta, TEE_STORAGE_PRIVATE, {"SOTER_COUNTER_OBJECT\0", 21}, data);
  };
  store(99'999'999'998);
  EXPECT_EQ(sign()["counter"], 99'999'999'999);
  const finish_answer refused = client().sign(blob, pkcs1, from_text("raw"));
  EXPECT_EQ(refused.error, KM_ERROR_UNKNOWN_ERROR);
  EXPECT_TRUE(tee.traced("json serialization error\n"));
  EXPECT_EQ(stored_counter(), 100'000'000'000U);
}

TEST_F(AttestationOccasionTest, AMessageOfFortyKilobytesFitsTheHeapAlthoughEachOfItsCharactersIsEscaped) {
  const std::string raw(40 * 1024, '"');
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1);
  EXPECT_TRUE(client().update(handle, from_text(raw)).ok());
  const finish_answer done = succeeds([&] { return client().finish(handle, {}, {}, 128 * 1024); });
  EXPECT_EQ(take_apart(done.data, 128).json()["raw"], raw);
}

}  // namespace
}  // namespace testing_support
