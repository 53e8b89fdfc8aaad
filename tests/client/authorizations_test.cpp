#include "client/lib/authorizations.h"

#include <gtest/gtest.h>

#include <stdexcept>

#include "client/kmctl/values.h"
#include "client/lib/wire.h"

namespace {

using namespace keymaster;
using namespace keymaster::client;
using kmctl::parse_hex;
using kmctl::to_hex;

TEST(Authorizations, AnEmptyListIsACountOfZero) {
  EXPECT_EQ(to_hex(authorizations{}.marshal()), "00000000");
  EXPECT_TRUE(authorizations::unmarshal(parse_hex("00000000")).empty());
}

TEST(Authorizations, EveryKindOfValueHasItsPlaceInTheRecord) {
  const bytes id{0xAA, 0xBB, 0xCC};
  const auto list = authorizations{}
                        .algorithm(KM_ALGORITHM_RSA)
                        .rsa_public_exponent(0x0102030405060708)
                        .no_auth_required()
                        .application_id(id)
                        .key_size(2048);
  EXPECT_EQ(to_hex(list.marshal()),
            "05000000"
            "02000010"
            "00000000"
            "0100000000000000"
            "0000000000000000"
            "c8000050"
            "00000000"
            "0807060504030201"
            "0000000000000000"
            "f7010070"
            "00000000"
            "0100000000000000"
            "0000000000000000"
            "59020090"
            "00000000"
            "0000000000000000"
            "0300000000000000"
            "aabbcc"
            "03000030"
            "00000000"
            "0008000000000000"
            "0000000000000000");
  EXPECT_EQ(list.marshalled_size(), list.marshal().size());
}

TEST(Authorizations, RepeatedTagsKeepTheirOrder) {
  const auto list = authorizations{}.digest({KM_DIGEST_SHA_2_512, KM_DIGEST_NONE}).purpose({KM_PURPOSE_VERIFY});
  EXPECT_EQ(list.numbers(KM_TAG_DIGEST), (std::vector<std::uint64_t>{6, 0}));
  EXPECT_EQ(list.count(KM_TAG_DIGEST), 2U);
  EXPECT_FALSE(list.unique_number(KM_TAG_DIGEST));
  EXPECT_EQ(list.unique_number(KM_TAG_PURPOSE), 3U);
  EXPECT_FALSE(list.unique_number(KM_TAG_PADDING));
}

TEST(Authorizations, WhatIsMarshalledComesBack) {
  const bytes token(69, 0x5C);
  const auto list = authorizations{}
                        .padding({KM_PAD_RSA_PSS, KM_PAD_NONE})
                        .usage_expire(date(std::chrono::milliseconds(1893456000123)))
                        .user_secure_id(UINT64_MAX)
                        .auth_token(token)
                        .application_data({})
                        .caller_nonce();
  EXPECT_EQ(authorizations::unmarshal(list.marshal()), list);
}

TEST(Authorizations, EveryShorterInputIsRefused) {
  const bytes id(5, 7);
  const bytes whole = authorizations{}.algorithm(KM_ALGORITHM_RSA).application_id(id).key_size(512).marshal();
  for (std::size_t length = 0; length < whole.size(); ++length) {
    EXPECT_THROW((void)authorizations::unmarshal(byte_view(whole).first(length)), format_error) << length;
  }
}

TEST(Authorizations, BytesBehindTheLastRecordAreIgnored) {
  bytes longer = authorizations{}.key_size(512).marshal();
  longer.push_back(0xFF);
  EXPECT_EQ(authorizations::unmarshal(longer), authorizations{}.key_size(512));
}

TEST(Authorizations, OnlyTheLowHalfOfABlobsLengthCounts) {
  const auto list =
      authorizations::unmarshal(parse_hex("01000000"
                                          "59020090"
                                          "11111111"
                                          "2222222222222222"
                                          "02000000ffffffff"
                                          "aabb"));
  ASSERT_EQ(list.size(), 1U);
  EXPECT_EQ(to_hex(list.begin()->blob), "aabb");
}

TEST(Authorizations, UnusedBytesOfANumberAreNotPartOfIt) {
  const auto list =
      authorizations::unmarshal(parse_hex("02000000"
                                          "03000030"
                                          "ffffffff"
                                          "00080000ffffffff"
                                          "ffffffffffffffff"
                                          "f7010070"
                                          "ffffffff"
                                          "01ffffffffffffff"
                                          "ffffffffffffffff"));
  EXPECT_EQ(list.unique_number(KM_TAG_KEY_SIZE), 2048U);
  EXPECT_EQ(list.unique_number(KM_TAG_NO_AUTH_REQUIRED), 1U);
}

TEST(Authorizations, AHugeBlobLengthIsRefusedWithoutReadingPastTheEnd) {
  EXPECT_THROW((void)authorizations::unmarshal(parse_hex("01000000"
                                                         "59020090"
                                                         "00000000"
                                                         "0000000000000000"
                                                         "ffffffff00000000"
                                                         "aa")),
               format_error);
}

TEST(Authorizations, ATagTakesOnlyItsOwnKindOfValue) {
  authorizations list;
  EXPECT_THROW(list.add(KM_TAG_APPLICATION_ID, std::uint64_t{1}), std::invalid_argument);
  EXPECT_THROW(list.add(KM_TAG_KEY_SIZE, byte_view{}), std::invalid_argument);
  EXPECT_THROW(list.add(KM_TAG_KEY_SIZE, std::uint64_t{1} << 32), std::invalid_argument);
  EXPECT_THROW(list.add(KM_TAG_CALLER_NONCE, std::uint64_t{2}), std::invalid_argument);
  EXPECT_THROW(list.active(date(std::chrono::milliseconds(-1))), std::invalid_argument);
  EXPECT_TRUE(list.empty());
}

TEST(Authorizations, AListCanBeAddedToItself) {
  auto list = authorizations{}.digest({KM_DIGEST_SHA1});
  list.add(list);
  EXPECT_EQ(list.numbers(KM_TAG_DIGEST), (std::vector<std::uint64_t>{2, 2}));
}

TEST(Authorizations, ABlobIsFoundWhenItIsTheOnlyOne) {
  auto list = authorizations{}.key_size(1);
  EXPECT_EQ(list.unique_blob(KM_TAG_NONCE), std::nullopt);
  EXPECT_EQ(list.nonce(bytes{1, 2}).unique_blob(KM_TAG_NONCE), (bytes{1, 2}));
  EXPECT_EQ(list.nonce(bytes{3}).unique_blob(KM_TAG_NONCE), std::nullopt);
}

}  // namespace
