// What begin is told when the command line leaves it open: what the key leaves no choice about.
#include "client/kmctl/operation_parameters.h"

#include <gtest/gtest.h>

#include "client/kmctl/exit_codes.h"

namespace {

using namespace keymaster;
using client::authorizations;
using kmctl::operation_parameters;
using kmctl::usage_error;

const authorizations rsa = authorizations{}.algorithm(KM_ALGORITHM_RSA).key_size(2048);
const authorizations ec = authorizations{}.algorithm(KM_ALGORITHM_EC).key_size(256);
const authorizations aes = authorizations{}.algorithm(KM_ALGORITHM_AES).key_size(256);
const authorizations hmac = authorizations{}.algorithm(KM_ALGORITHM_HMAC).key_size(256);

TEST(OperationParameters, TheOnlyChoiceOfTheKeyIsTaken) {
  const auto key =
      authorizations(rsa).padding({KM_PAD_RSA_PKCS1_1_5_SIGN, KM_PAD_RSA_OAEP}).digest({KM_DIGEST_SHA_2_384});
  EXPECT_EQ(operation_parameters(KM_PURPOSE_SIGN, {}, key),
            authorizations{}.padding({KM_PAD_RSA_PKCS1_1_5_SIGN}).digest({KM_DIGEST_SHA_2_384}));
  EXPECT_EQ(operation_parameters(KM_PURPOSE_DECRYPT, {}, key),
            authorizations{}.padding({KM_PAD_RSA_OAEP}).digest({KM_DIGEST_SHA_2_384}));
}

TEST(OperationParameters, AChoiceIsTheUsers) {
  const auto key =
      authorizations(rsa).padding({KM_PAD_RSA_PKCS1_1_5_SIGN, KM_PAD_RSA_PSS}).digest({KM_DIGEST_SHA_2_256});
  try {
    (void)operation_parameters(KM_PURPOSE_SIGN, {}, key);
    FAIL();
  } catch (const usage_error& refused) {
    EXPECT_STREQ(refused.what(), "the key allows more than one padding: pkcs1-1-5-sign, pss");
    EXPECT_EQ(refused.hint(), "say which one with --padding");
  }
  EXPECT_EQ(operation_parameters(KM_PURPOSE_SIGN, authorizations{}.padding({KM_PAD_RSA_PSS}), key),
            authorizations{}.padding({KM_PAD_RSA_PSS}).digest({KM_DIGEST_SHA_2_256}));
  EXPECT_THROW((void)operation_parameters(KM_PURPOSE_SIGN, {}, rsa), usage_error);
}

TEST(OperationParameters, ASigningKeyNamesNoPaddingToEncryptWith) {
  const auto key = authorizations(rsa).padding({KM_PAD_RSA_PSS}).digest({KM_DIGEST_SHA_2_256});
  try {
    (void)operation_parameters(KM_PURPOSE_ENCRYPT, {}, key);
    FAIL();
  } catch (const usage_error& refused) {
    EXPECT_STREQ(refused.what(), "the key names no padding that could be used");
  }
}

TEST(OperationParameters, RawPaddingTakesNoDigestWhateverTheKeyLists) {
  const auto key = authorizations(rsa).padding({KM_PAD_NONE}).digest({KM_DIGEST_SHA_2_256, KM_DIGEST_NONE});
  EXPECT_EQ(operation_parameters(KM_PURPOSE_SIGN, {}, key),
            authorizations{}.padding({KM_PAD_NONE}).digest({KM_DIGEST_NONE}));
}

TEST(OperationParameters, OnlyOaepEncryptsWithADigestAndNotWithEveryOne) {
  EXPECT_EQ(operation_parameters(
                KM_PURPOSE_ENCRYPT, {},
                authorizations(rsa).padding({KM_PAD_RSA_OAEP}).digest({KM_DIGEST_NONE, KM_DIGEST_MD5, KM_DIGEST_SHA1})),
            authorizations{}.padding({KM_PAD_RSA_OAEP}).digest({KM_DIGEST_SHA1}));
  for (const keymaster_padding_t padding : {KM_PAD_RSA_PKCS1_1_5_ENCRYPT, KM_PAD_NONE}) {
    EXPECT_EQ(operation_parameters(KM_PURPOSE_DECRYPT, {},
                                   authorizations(rsa).padding({padding}).digest({KM_DIGEST_SHA_2_256})),
              authorizations{}.padding({padding}));
  }
}

TEST(OperationParameters, AnEcKeyNeedsItsDigest) {
  EXPECT_EQ(operation_parameters(KM_PURPOSE_SIGN, {}, authorizations(ec).digest({KM_DIGEST_SHA_2_256})),
            authorizations{}.digest({KM_DIGEST_SHA_2_256}));
}

TEST(OperationParameters, AMacIsAsLongAsItsDigestUnlessToldOtherwise) {
  struct row {
    keymaster_digest_t digest;
    std::uint32_t bits;
  };
  for (const auto& [digest, bits] :
       {row{KM_DIGEST_MD5, 128}, row{KM_DIGEST_SHA1, 160}, row{KM_DIGEST_SHA_2_224, 224}, row{KM_DIGEST_SHA_2_256, 256},
        row{KM_DIGEST_SHA_2_384, 384}, row{KM_DIGEST_SHA_2_512, 512}}) {
    const auto key = authorizations(hmac).digest({digest}).min_mac_length(64);
    EXPECT_EQ(operation_parameters(KM_PURPOSE_VERIFY, {}, key), authorizations{}.digest({digest}).mac_length(bits));
  }
  EXPECT_EQ(operation_parameters(KM_PURPOSE_SIGN, authorizations{}.mac_length(96),
                                 authorizations(hmac).digest({KM_DIGEST_SHA_2_256})),
            authorizations{}.mac_length(96).digest({KM_DIGEST_SHA_2_256}));
}

TEST(OperationParameters, ABlockModeBringsWhatItNeeds) {
  struct row {
    keymaster_block_mode_t mode;
    authorizations expected;
    std::size_t nonce;
  };
  const auto key =
      authorizations(aes).block_mode({KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM}).padding({KM_PAD_PKCS7});
  for (const auto& [mode, expected, nonce] : {
           row{KM_MODE_ECB, authorizations{}.padding({KM_PAD_PKCS7}), 0},
           row{KM_MODE_CBC, authorizations{}.padding({KM_PAD_PKCS7}), 16},
           row{KM_MODE_CTR, authorizations{}.padding({KM_PAD_NONE}), 16},
           row{KM_MODE_GCM, authorizations{}.padding({KM_PAD_NONE}).mac_length(128), 12},
       }) {
    const auto given = authorizations{}.block_mode({mode});
    const auto all = operation_parameters(KM_PURPOSE_ENCRYPT, given, key);
    EXPECT_EQ(all, authorizations(given).add(expected)) << mode;
    EXPECT_EQ(kmctl::nonce_size(all), nonce) << mode;
  }
  EXPECT_THROW((void)operation_parameters(KM_PURPOSE_ENCRYPT, {}, key), usage_error);
}

TEST(OperationParameters, NothingIsChosenForAPurposeThatTheAlgorithmDoesNotServe) {
  EXPECT_TRUE(operation_parameters(KM_PURPOSE_ENCRYPT, {}, authorizations(ec).digest({KM_DIGEST_SHA1})).empty());
  EXPECT_TRUE(operation_parameters(KM_PURPOSE_SIGN, {}, authorizations(aes).block_mode({KM_MODE_GCM})).empty());
  EXPECT_EQ(kmctl::nonce_size({}), 0U);
}

}  // namespace
