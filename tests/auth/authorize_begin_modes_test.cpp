// Begin: what kind of key it is, what it may be used for, and in which modes.
#include "tests/auth/authorize_begin_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace {

using Lines = std::vector<std::string>;

param_list requested(std::uint32_t padding, std::uint32_t block_mode, std::uint32_t digest) {
  return param_list{}.add(KM_TAG_PADDING, padding).add(KM_TAG_BLOCK_MODE, block_mode).add(KM_TAG_DIGEST, digest);
}

TEST_F(AuthorizeBeginTest, AKeyWithoutExactlyOneAlgorithmIsNoKey) {
  const Lines line = {"No or too many KM_TAG_ALGORITHM in key_params"};
  expect_refused(begin({}), KM_ERROR_INVALID_KEY_BLOB, line);
  expect_refused(begin(key_of().remove(KM_TAG_ALGORITHM)), KM_ERROR_INVALID_KEY_BLOB, line);
  expect_refused(begin(key_of().add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC)), KM_ERROR_INVALID_KEY_BLOB, line);
}

TEST_F(AuthorizeBeginTest, PublicKeyOperationsAreNeverRestricted) {
  registry.has_algorithm = registry.has_purpose_ops = false;
  for (const std::uint32_t algorithm : {KM_ALGORITHM_RSA, KM_ALGORITHM_EC}) {
    const param_list hopeless = param_list{}
                                    .add(KM_TAG_BOOTLOADER_ONLY)
                                    .add(KM_TAG_ALGORITHM, algorithm)
                                    .add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, 1)
                                    .add(KM_TAG_USAGE_EXPIRE_DATETIME, 1)
                                    .add(KM_TAG_ACTIVE_DATETIME, ~std::uint64_t{0})
                                    .add(KM_TAG_USER_SECURE_ID, 5)
                                    .add(KM_TAG_MAX_USES_PER_BOOT, 0);
    const param_list request = requested(7, 7, 7).add_blob(KM_TAG_AUTH_TOKEN, pattern(10)).add_blob(KM_TAG_NONCE, {});
    for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_VERIFY}) {
      for (int i = 0; i < 3; ++i) expect_granted(begin(hopeless, purpose, request));
    }
  }
}

TEST_F(AuthorizeBeginTest, OtherOperationsOfThoseAlgorithmsAndOthersAreRestricted) {
  struct row {
    std::uint32_t algorithm, purpose;
  };
  for (const row& r : {row{KM_ALGORITHM_RSA, KM_PURPOSE_SIGN},
                       {KM_ALGORITHM_RSA, KM_PURPOSE_DECRYPT},
                       {KM_ALGORITHM_EC, KM_PURPOSE_SIGN},
                       {KM_ALGORITHM_EC, KM_PURPOSE_DECRYPT},
                       {KM_ALGORITHM_AES, KM_PURPOSE_ENCRYPT},
                       {KM_ALGORITHM_AES, KM_PURPOSE_DECRYPT},
                       {KM_ALGORITHM_HMAC, KM_PURPOSE_SIGN},
                       {KM_ALGORITHM_HMAC, KM_PURPOSE_VERIFY}}) {
    expect_refused(begin(key_of(r.algorithm).add(KM_TAG_BOOTLOADER_ONLY), r.purpose), KM_ERROR_INVALID_KEY_BLOB,
                   {"Bootloader only key"});
  }
}

TEST_F(AuthorizeBeginTest, AnAlgorithmThatNobodyServesIsUnsupported) {
  registry.has_algorithm = registry.has_purpose_ops = false;
  expect_refused(begin(key_of(77)), KM_ERROR_UNSUPPORTED_ALGORITHM, {});
}

TEST_F(AuthorizeBeginTest, APurposeWithoutRecordOrWithoutAPartOfItIsUnsupported) {
  registry.has_purpose_ops = false;
  expect_refused(begin(key_of()), KM_ERROR_UNSUPPORTED_PURPOSE, {});
  for (int missing = 0; missing < 3; ++missing) {
    registry = fake_registry();
    if (missing == 0) registry.ops.get_padding = nullptr;
    if (missing == 1) registry.ops.get_block_mode = nullptr;
    if (missing == 2) registry.ops.get_digest = nullptr;
    expect_refused(begin(key_of()), KM_ERROR_UNSUPPORTED_PURPOSE, {});
  }
}

TEST_F(AuthorizeBeginTest, ThePurposeMustBeListed) {
  for (const std::uint32_t listed : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT, KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    const param_list key = param_list{}.add(KM_TAG_PURPOSE, listed).add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES);
    for (std::uint32_t purpose = 0; purpose < 5; ++purpose) {
      if (purpose == listed) {
        expect_granted(begin(key, purpose));
      } else {
        expect_refused(begin(key, purpose), KM_ERROR_INCOMPATIBLE_PURPOSE, {"No such purpose in key_params"});
      }
    }
  }
}

TEST_F(AuthorizeBeginTest, WhatIsRequestedMustBeListed) {
  const param_list request = requested(KM_PAD_PKCS7, KM_MODE_CBC, KM_DIGEST_SHA1);
  const param_list listed = key_of()
                                .add(KM_TAG_PADDING, KM_PAD_NONE)
                                .add(KM_TAG_PADDING, KM_PAD_PKCS7)
                                .add(KM_TAG_BLOCK_MODE, KM_MODE_CBC)
                                .add(KM_TAG_BLOCK_MODE, KM_MODE_ECB)
                                .add(KM_TAG_DIGEST, KM_DIGEST_MD5)
                                .add(KM_TAG_DIGEST, KM_DIGEST_SHA1)
                                .add(KM_TAG_DIGEST, KM_DIGEST_MD5);
  expect_granted(begin(listed, KM_PURPOSE_SIGN, request));
  expect_refused(begin(listed, KM_PURPOSE_SIGN, requested(KM_PAD_RSA_PSS, KM_MODE_CBC, KM_DIGEST_SHA1)),
                 KM_ERROR_INCOMPATIBLE_PADDING_MODE, {"No such padding in key_params"});
  expect_refused(begin(listed, KM_PURPOSE_SIGN, requested(KM_PAD_PKCS7, KM_MODE_CTR, KM_DIGEST_SHA1)),
                 KM_ERROR_INCOMPATIBLE_BLOCK_MODE, {"No such block mode in key_params"});
  expect_refused(begin(listed, KM_PURPOSE_SIGN, requested(KM_PAD_PKCS7, KM_MODE_CBC, KM_DIGEST_SHA_2_256)),
                 KM_ERROR_INCOMPATIBLE_DIGEST, {"No such digest in key_params"});
}

TEST_F(AuthorizeBeginTest, AValueOfZeroIsAValueAndMustBeListed) {
  const param_list request = param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_NONE);
  expect_refused(begin(key_of(), KM_PURPOSE_SIGN, request), KM_ERROR_INCOMPATIBLE_DIGEST,
                 {"No such digest in key_params"});
  expect_granted(begin(key_of().add(KM_TAG_DIGEST, KM_DIGEST_NONE), KM_PURPOSE_SIGN, request));
}

TEST_F(AuthorizeBeginTest, WhatDoesNotApplyNeedsNoListing) {
  expect_granted(begin(key_of()));
  const param_list twice = param_list{}
                               .add(KM_TAG_PADDING, KM_PAD_NONE)
                               .add(KM_TAG_PADDING, KM_PAD_NONE)
                               .add(KM_TAG_DIGEST, KM_DIGEST_MD5)
                               .add(KM_TAG_DIGEST, KM_DIGEST_SHA1);
  expect_granted(begin(key_of(), KM_PURPOSE_SIGN, twice));
}

TEST_F(AuthorizeBeginTest, UnmetRequirementsAreToldInTheirOrder) {
  const param_list request = requested(KM_PAD_PKCS7, KM_MODE_CBC, KM_DIGEST_SHA1);
  param_list key =
      param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES).add(KM_TAG_USER_SECURE_ID, 5).add(KM_TAG_USER_AUTH_TYPE, 1);
  expect_refused(begin(key, KM_PURPOSE_ENCRYPT, request), KM_ERROR_INCOMPATIBLE_PURPOSE,
                 {"No such purpose in key_params"});
  key.add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT);
  expect_refused(begin(key, KM_PURPOSE_ENCRYPT, request), KM_ERROR_INCOMPATIBLE_PADDING_MODE,
                 {"No such padding in key_params"});
  key.add(KM_TAG_PADDING, KM_PAD_PKCS7);
  expect_refused(begin(key, KM_PURPOSE_ENCRYPT, request), KM_ERROR_INCOMPATIBLE_BLOCK_MODE,
                 {"No such block mode in key_params"});
  key.add(KM_TAG_BLOCK_MODE, KM_MODE_CBC);
  expect_refused(begin(key, KM_PURPOSE_ENCRYPT, request), KM_ERROR_INCOMPATIBLE_DIGEST,
                 {"No such digest in key_params"});
  key.add(KM_TAG_DIGEST, KM_DIGEST_SHA1);
  expect_refused(begin(key, KM_PURPOSE_ENCRYPT, request), KM_OP_AUTH_NEEDED, {"OP AUTH NEEDED"});
}

TEST_F(AuthorizeBeginTest, ABootloaderOnlyKeyIsRefusedWhateverTheTagsValue) {
  for (const std::uint32_t value : {0U, 1U}) {
    expect_refused(begin(key_of().add(KM_TAG_BOOTLOADER_ONLY, value)), KM_ERROR_INVALID_KEY_BLOB,
                   {"Bootloader only key"});
  }
}

TEST_F(AuthorizeBeginTest, MacsMustNotBeShorterThanTheKeysMinimum) {
  const param_list hmac = key_of(KM_ALGORITHM_HMAC).add(KM_TAG_MIN_MAC_LENGTH, 128);
  const auto asking = [](std::uint32_t bits) { return param_list{}.add(KM_TAG_MAC_LENGTH, bits); };
  expect_refused(begin(hmac, KM_PURPOSE_SIGN, asking(127)), KM_ERROR_INVALID_MAC_LENGTH, {});
  expect_refused(begin(hmac, KM_PURPOSE_SIGN, asking(0)), KM_ERROR_INVALID_MAC_LENGTH, {});
  expect_granted(begin(hmac, KM_PURPOSE_SIGN, asking(128)));
  expect_granted(begin(hmac, KM_PURPOSE_SIGN, asking(0xFFFFFFFF)));
  expect_granted(begin(hmac, KM_PURPOSE_SIGN));
}

TEST_F(AuthorizeBeginTest, AesMacsAreThoseOfGcm) {
  const param_list aes = key_of(KM_ALGORITHM_AES)
                             .add(KM_TAG_BLOCK_MODE, KM_MODE_GCM)
                             .add(KM_TAG_BLOCK_MODE, KM_MODE_CTR)
                             .add(KM_TAG_MIN_MAC_LENGTH, 96);
  const auto asking = [](std::uint32_t mode, std::uint32_t bits) {
    return param_list{}.add(KM_TAG_BLOCK_MODE, mode).add(KM_TAG_MAC_LENGTH, bits);
  };
  expect_refused(begin(aes, KM_PURPOSE_ENCRYPT, asking(KM_MODE_GCM, 88)), KM_ERROR_INVALID_MAC_LENGTH, {});
  expect_granted(begin(aes, KM_PURPOSE_ENCRYPT, asking(KM_MODE_GCM, 96)));
  expect_granted(begin(aes, KM_PURPOSE_ENCRYPT, asking(KM_MODE_CTR, 88)));
}

TEST_F(AuthorizeBeginTest, OtherAlgorithmsHaveNoMacs) {
  for (const std::uint32_t algorithm : {KM_ALGORITHM_RSA, KM_ALGORITHM_EC}) {
    expect_granted(begin(key_of(algorithm).add(KM_TAG_MIN_MAC_LENGTH, 128), KM_PURPOSE_SIGN,
                         param_list{}.add(KM_TAG_MAC_LENGTH, 8)));
  }
}

TEST_F(AuthorizeBeginTest, ACallersNonceNeedsThePermissionToEncrypt) {
  const param_list nonce = param_list{}.add_blob(KM_TAG_NONCE, pattern(12));
  const param_list key = key_of(KM_ALGORITHM_AES);
  expect_refused(begin(key, KM_PURPOSE_ENCRYPT, nonce), KM_ERROR_CALLER_NONCE_PROHIBITED, {"Caller nonce prohibited"});
  expect_granted(begin(key, KM_PURPOSE_DECRYPT, nonce));
  expect_granted(begin(key, KM_PURPOSE_ENCRYPT));
  expect_granted(begin(param_list{key}.add(KM_TAG_CALLER_NONCE), KM_PURPOSE_ENCRYPT, nonce));
}

TEST_F(AuthorizeBeginTest, TagsWithoutARuleSayNothing) {
  expect_granted(begin(key_of()
                           .add(KM_TAG_KEY_SIZE, 0)
                           .add(KM_TAG_ORIGIN, 99)
                           .add(KM_TAG_BLOB_USAGE_REQUIREMENTS, 5)
                           .add_blob(KM_TAG_ROOT_OF_TRUST, pattern(3))
                           .add(0xB0000001, 1)
                           .add(KM_TAG_USER_AUTH_TYPE, 1)
                           .add(KM_TAG_AUTH_TIMEOUT, 1)
                           .add(KM_TAG_NO_AUTH_REQUIRED)));
}

TEST_F(AuthorizeBeginTest, TheFirstRefusalInTheKeysOrderIsTheAnswer) {
  const std::uint64_t never = ~std::uint64_t{0};
  expect_refused(begin(key_of().add(KM_TAG_ACTIVE_DATETIME, never).add(KM_TAG_BOOTLOADER_ONLY)),
                 KM_ERROR_KEY_NOT_YET_VALID, {"Key not yet valid"});
  expect_refused(begin(key_of().add(KM_TAG_BOOTLOADER_ONLY).add(KM_TAG_ACTIVE_DATETIME, never)),
                 KM_ERROR_INVALID_KEY_BLOB, {"Bootloader only key"});
  expect_refused(begin(param_list{}
                           .add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, 1)
                           .add(KM_TAG_BOOTLOADER_ONLY)
                           .add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)),
                 KM_ERROR_KEY_EXPIRED, {"Key expired"});
}

}  // namespace
