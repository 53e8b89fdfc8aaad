// What is said of attested keys, completed and judged before the TA is asked.
#include "client/kmctl/attested_key.h"

#include <gtest/gtest.h>

#include "client/kmctl/authorization_options.h"
#include "client/kmctl/exit_codes.h"

namespace {

using namespace keymaster;
using client::authorizations;
using kmctl::attested_description;
using kmctl::option_use;
using kmctl::usage_error;
using kmctl::with_defaults;

authorizations soter() {
  return authorizations{}.soter_key();
}

TEST(AttestedKey, OtherKeysStayAsTheyWereDescribed) {
  const auto plain = authorizations{}.algorithm(KM_ALGORITHM_AES).key_size(128);
  EXPECT_EQ(attested_description(plain), plain);
  EXPECT_EQ(attested_description({}), authorizations{});
}

TEST(AttestedKey, IsSignedByTheAttestationKeyUnlessAnotherKeyIsNamed) {
  EXPECT_EQ(attested_description(soter()), soter().purpose({KM_PURPOSE_SIGN}).soter_signed_by_attk());
  EXPECT_EQ(attested_description(soter().soter_signed_by_attk()),
            soter().soter_signed_by_attk().purpose({KM_PURPOSE_SIGN}));
  const auto named = soter().soter_signing_key_blob(client::bytes{1, 2});
  EXPECT_EQ(attested_description(named), authorizations(named).purpose({KM_PURPOSE_SIGN}).soter_signed_by_key());
}

TEST(AttestedKey, IsAnRsa2048KeyThatSignsADigest) {
  const auto all = with_defaults(soter(), option_use::generate);
  EXPECT_EQ(all.unique_number(KM_TAG_ALGORITHM), KM_ALGORITHM_RSA);
  EXPECT_EQ(all.unique_number(KM_TAG_KEY_SIZE), 2048U);
  EXPECT_EQ(all.numbers(KM_TAG_PURPOSE), (std::vector<std::uint64_t>{KM_PURPOSE_SIGN}));
  EXPECT_EQ(all.numbers(KM_TAG_DIGEST), (std::vector<std::uint64_t>{KM_DIGEST_SHA_2_256}));
  EXPECT_EQ(all.numbers(KM_TAG_PADDING), (std::vector<std::uint64_t>{KM_PAD_RSA_PKCS1_1_5_SIGN}));
  EXPECT_EQ(with_defaults(soter().padding({KM_PAD_RSA_PSS}), option_use::generate).numbers(KM_TAG_PADDING),
            (std::vector<std::uint64_t>{KM_PAD_RSA_PSS}));
}

TEST(AttestedKey, WhatWouldLetOthersMakeItsStatementsIsRefused) {
  for (const authorizations& worthless : {
           soter().purpose({KM_PURPOSE_SIGN, KM_PURPOSE_DECRYPT}),
           soter().purpose({KM_PURPOSE_DECRYPT}),
           soter().purpose({KM_PURPOSE_ENCRYPT}),
           soter().padding({KM_PAD_NONE}),
           soter().padding({KM_PAD_RSA_PSS, KM_PAD_NONE}),
           soter().padding({KM_PAD_RSA_OAEP}),
           soter().digest({KM_DIGEST_NONE}),
           soter().digest({KM_DIGEST_MD5}),
           soter().digest({KM_DIGEST_SHA_2_256, KM_DIGEST_NONE}),
           soter().key_size(1024),
           soter().key_size(2047),
           soter().key_size(4097),
           soter().algorithm(KM_ALGORITHM_EC),
           soter().algorithm(KM_ALGORITHM_AES),
           soter().soter_signed_by_attk().soter_signing_key_blob(client::bytes{1}),
           soter().soter_uid(UINT32_MAX),
       }) {
    EXPECT_THROW((void)attested_description(worthless), usage_error);
  }
}

TEST(AttestedKey, DetailsOfAnAttestedKeyNeedOne) {
  for (const authorizations& detail :
       {authorizations{}.soter_signed_by_attk(), authorizations{}.soter_signing_key_blob(client::bytes{1}),
        authorizations{}.soter_counted(), authorizations{}.soter_uid(7)}) {
    EXPECT_THROW((void)attested_description(detail), usage_error);
  }
}

}  // namespace
