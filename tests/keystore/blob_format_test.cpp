// Key blobs as everybody else sees them: made by the TA and read with libcrypto, and the other way round.
#include <set>

#include "tests/keystore/keystore_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::IsEmpty;

namespace {

class BlobFormatTest : public BlobTest {
 protected:
  static bytes plaintext_of(const bytes& key, const param_list& list) {
    return join({prefixed(key), prefixed(list.marshal())});
  }

  void expect_opens(const bytes& blob, const bytes& key, const param_list& list) {
    const opened answer = open(blob);
    EXPECT_EQ(answer.result, TEE_SUCCESS);
    EXPECT_EQ(answer.error, KM_ERROR_OK);
    EXPECT_EQ(answer.key_data, key);
    EXPECT_EQ(answer.characteristics.marshal(), list.marshal());
    EXPECT_THAT(errors(), IsEmpty());
  }
};

TEST_F(BlobFormatTest, LibcryptoReadsWhatTheTaSealed) {
  const bytes blob = must_save(key_data, characteristics);
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_EQ(blob.size(), blob_size());
  EXPECT_EQ(blob[0], KEY_PROTECTION_RPMB);
  EXPECT_EQ(unseal(rpmb_value(), blob), plaintext_of(key_data, characteristics)) << "hidden parameters included";
}

TEST_F(BlobFormatTest, TheTaReadsWhatLibcryptoSealed) {
  const bytes plaintext = plaintext_of(key_data, characteristics);
  expect_opens(seal(0, derived_value(), pattern(64, 1), pattern(12, 2), plaintext), key_data, characteristics);
  expect_opens(seal(1, rpmb_value(), pattern(64, 3), pattern(12, 4), plaintext), key_data, characteristics);
}

TEST_F(BlobFormatTest, WithoutRpmbTheDerivedKskSeals) {
  reboot(false);
  const bytes blob = must_save(key_data, characteristics);
  EXPECT_EQ(blob[0], KEY_PROTECTION_DERIVED);
  EXPECT_EQ(unseal(derived_value(), blob), plaintext_of(key_data, characteristics));
  expect_opens(blob, key_data, characteristics);
}

TEST_F(BlobFormatTest, AnEmptyKeyWithoutParametersIs105Bytes) {
  const bytes blob = must_save({}, {});
  EXPECT_EQ(blob.size(), 105U);
  EXPECT_EQ(to_hex(unseal(rpmb_value(), blob).value_or(bytes{})),
            "00000000"
            "04000000"
            "00000000");
  const opened answer = open(blob);
  EXPECT_EQ(answer.error, KM_ERROR_OK);
  EXPECT_TRUE(answer.key_data.empty());
  EXPECT_TRUE(answer.has_key_data) << "an empty key is not a missing one";
  EXPECT_TRUE(answer.characteristics.params().empty());
}

TEST_F(BlobFormatTest, KeysOfAllSizesComeBack) {
  for (const std::size_t size : {0U, 1U, 15U, 16U, 17U, 255U, 256U, 1196U, 4652U}) {
    const param_list list = param_list{}.add(KM_TAG_KEY_SIZE, size).add_blob(KM_TAG_APPLICATION_ID, pattern(size % 50));
    const bytes key = pattern(size, 11);
    const bytes blob = must_save(key, list);
    EXPECT_EQ(blob.size(), 101 + size + list.marshal().size());
    expect_opens(blob, key, list);
    EXPECT_EQ(unseal(rpmb_value(), blob), plaintext_of(key, list));
  }
}

TEST_F(BlobFormatTest, EveryBlobHasANonceAndIvOfItsOwn) {
  std::set<std::string> seen;
  for (int i = 0; i < 20; ++i) {
    const bytes blob = must_save(key_data, characteristics);
    ASSERT_EQ(blob.size(), blob_size());
    const std::span<const std::uint8_t> fields = blob;
    EXPECT_TRUE(seen.insert(to_hex(fields.subspan(1, 64))).second);
    EXPECT_TRUE(seen.insert(to_hex(fields.subspan(65, 12))).second);
    EXPECT_TRUE(seen.insert(to_hex(fields.subspan(93))).second) << "the same key never looks the same";
  }
}

TEST_F(BlobFormatTest, TheCipherIsGcmWithoutAssociatedDataFedInFourPieces) {
  spy = platform_spy();
  const bytes blob = must_save(key_data, characteristics);
  ASSERT_EQ(spy.ae_started.size(), 1U);
  EXPECT_EQ(spy.ae_started[0].nonce, bytes(blob.begin() + 65, blob.begin() + 77));
  EXPECT_EQ(spy.ae_started[0].tag_bits, 128U);
  EXPECT_EQ(spy.ae_started[0].aad_length, 0U);
  EXPECT_EQ(spy.ae_started[0].payload_length, 0U);
  const bytes marshalled = characteristics.marshal();
  EXPECT_THAT(spy.encrypted, ::testing::ElementsAre(u32(static_cast<std::uint32_t>(key_data.size())), key_data,
                                                    u32(static_cast<std::uint32_t>(marshalled.size())), marshalled));
}

TEST_F(BlobFormatTest, ABlobOpensAfterARestart) {
  const bytes blob = must_save(key_data, characteristics);
  reboot(true);
  expect_opens(blob, key_data, characteristics);
}

TEST_F(BlobFormatTest, ABlobOfTheDerivedKskOpensWhereThereIsRpmb) {
  reboot(false);
  const bytes blob = must_save(key_data, characteristics);
  reboot(true);
  ASSERT_NE(rpmb_ksk(), nullptr);
  expect_opens(blob, key_data, characteristics);
}

TEST_F(BlobFormatTest, ABlobOfTheRpmbKskNeedsIt) {
  const bytes blob = must_save(key_data, characteristics);
  reboot(false);
  expect_not_opened(open(blob), 0xF0100003, untouched, {"RPMB KSK died, fail to open key"});
  reboot(true);
  expect_opens(blob, key_data, characteristics);
}

TEST_F(BlobFormatTest, ADeletedRpmbKskTakesItsBlobsAlong) {
  const bytes blob = must_save(key_data, characteristics);
  key_store_release();
  store_ksk(pattern(16));
  ASSERT_EQ(key_store_init(), KSK_ERROR_DELETED);
  start_keys();
  expect_not_opened(open(blob), TEE_ERROR_MAC_INVALID, untouched, {"AEDecryptFinal failed with 0xffff3071\n"});
}

}  // namespace
