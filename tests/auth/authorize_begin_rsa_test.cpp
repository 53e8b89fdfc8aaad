// Begin's policy with the algorithms that the TA really has.
#include "tests/auth/auth_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

class AuthorizeBeginRsaTest : public AuthTest {
 protected:
  keymaster_error_t begin(const param_list& key, std::uint32_t purpose, const param_list& params) {
    const auto before = ta.holdings();
    keymaster_error_t error = static_cast<keymaster_error_t>(0x7777);
    {
      const parameter_set characteristics = in_ta(key), in_params = in_ta(params);
      ta.clear_trace();
      EXPECT_EQ(authorize_begin(pattern(150), purpose, in_params, characteristics, &error), TEE_SUCCESS);
    }
    expect_same(ta.holdings(), before);
    return error;
  }

  /// A key that signs with one padding and one digest.
  static param_list narrow_key() {
    return param_list{}
        .add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA)
        .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
        .add(KM_TAG_PADDING, KM_PAD_RSA_PSS)
        .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
  }
};

TEST_F(AuthorizeBeginRsaTest, SigningAsListedIsGranted) {
  EXPECT_EQ(begin(narrow_key(), KM_PURPOSE_SIGN, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS)), KM_ERROR_OK);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(AuthorizeBeginRsaTest, AnotherPaddingOrDigestIsRefused) {
  EXPECT_EQ(begin(narrow_key(), KM_PURPOSE_SIGN, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN)),
            KM_ERROR_INCOMPATIBLE_PADDING_MODE);
  EXPECT_THAT(ta.errors(), ElementsAre("No such padding in key_params"));
  EXPECT_EQ(begin(narrow_key(), KM_PURPOSE_SIGN, signature(KM_DIGEST_SHA1, KM_PAD_RSA_PSS)),
            KM_ERROR_INCOMPATIBLE_DIGEST);
  EXPECT_THAT(ta.errors(), ElementsAre("No such digest in key_params"));
}

// Where the padding is for encryption, the digest is a part of it, and the key's digests don't restrict it.
TEST_F(AuthorizeBeginRsaTest, ADigestCountsWithThePaddingsOfSignaturesOnly) {
  const param_list key = narrow_key()
                             .remove(KM_TAG_PADDING)
                             .add(KM_TAG_PADDING, KM_PAD_RSA_OAEP)
                             .add(KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_ENCRYPT);
  for (const std::uint32_t padding : {KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT}) {
    EXPECT_EQ(begin(key, KM_PURPOSE_SIGN, signature(KM_DIGEST_SHA1, padding)), KM_ERROR_OK) << padding;
  }
  for (const std::uint32_t padding : {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN}) {
    const param_list allowed = narrow_key().remove(KM_TAG_PADDING).add(KM_TAG_PADDING, padding);
    EXPECT_EQ(begin(allowed, KM_PURPOSE_SIGN, signature(KM_DIGEST_SHA_2_256, padding)), KM_ERROR_OK) << padding;
    EXPECT_EQ(begin(allowed, KM_PURPOSE_SIGN, signature(KM_DIGEST_SHA1, padding)), KM_ERROR_INCOMPATIBLE_DIGEST)
        << padding;
  }
}

TEST_F(AuthorizeBeginRsaTest, APaddingThatIsRepeatedIsNoneAndTakesTheDigestWithIt) {
  for (const std::uint32_t second : {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_PAD_RSA_PSS}) {
    const param_list request = signature(KM_DIGEST_SHA1, KM_PAD_RSA_PKCS1_1_5_SIGN).add(KM_TAG_PADDING, second);
    EXPECT_EQ(begin(narrow_key(), KM_PURPOSE_SIGN, request), KM_ERROR_OK);
  }
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(AuthorizeBeginRsaTest, WithoutAPaddingTheDigestDoesNotCount) {
  EXPECT_EQ(begin(narrow_key(), KM_PURPOSE_SIGN, param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_SHA1)), KM_ERROR_OK);
  EXPECT_EQ(begin(narrow_key(), KM_PURPOSE_SIGN, {}), KM_ERROR_OK);
}

TEST_F(AuthorizeBeginRsaTest, ADigestThatIsRepeatedIsNone) {
  for (const std::uint32_t second : {KM_DIGEST_SHA1, KM_DIGEST_SHA_2_512}) {
    EXPECT_EQ(
        begin(narrow_key(), KM_PURPOSE_SIGN, signature(KM_DIGEST_SHA1, KM_PAD_RSA_PSS).add(KM_TAG_DIGEST, second)),
        KM_ERROR_OK);
  }
}

TEST_F(AuthorizeBeginRsaTest, RsaHasNoBlockModes) {
  EXPECT_EQ(begin(narrow_key(), KM_PURPOSE_SIGN,
                  signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS).add(KM_TAG_BLOCK_MODE, KM_MODE_GCM)),
            KM_ERROR_OK);
}

TEST_F(AuthorizeBeginRsaTest, AKeyThatOnlyVerifiesDoesNotSign) {
  EXPECT_EQ(begin(narrow_key().remove(KM_TAG_PURPOSE).add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY), KM_PURPOSE_SIGN,
                  signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS)),
            KM_ERROR_INCOMPATIBLE_PURPOSE);
  EXPECT_THAT(ta.errors(), ElementsAre("No such purpose in key_params"));
}

TEST_F(AuthorizeBeginRsaTest, VerifyingIsForEverybody) {
  EXPECT_EQ(begin(narrow_key().add(KM_TAG_USAGE_EXPIRE_DATETIME, 1), KM_PURPOSE_VERIFY, {}), KM_ERROR_OK);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(AuthorizeBeginRsaTest, ANumberThatIsNoAlgorithmIsUnsupported) {
  for (const std::uint32_t algorithm : {0U, 2U, 4U, 33U, 129U, 0xFFFFFFFFU}) {
    EXPECT_EQ(begin(param_list{}.add(KM_TAG_ALGORITHM, algorithm), KM_PURPOSE_SIGN, {}),
              KM_ERROR_UNSUPPORTED_ALGORITHM);
  }
}

TEST_F(AuthorizeBeginRsaTest, ANumberThatIsNoPurposeIsUnsupported) {
  for (const std::uint32_t algorithm : {KM_ALGORITHM_RSA, KM_ALGORITHM_EC, KM_ALGORITHM_AES, KM_ALGORITHM_HMAC}) {
    for (const std::uint32_t purpose : {4U, 5U, 0xFFFFFFFFU}) {
      EXPECT_EQ(begin(param_list{}.add(KM_TAG_ALGORITHM, algorithm), purpose, {}), KM_ERROR_UNSUPPORTED_PURPOSE);
    }
  }
}

}  // namespace
