// What the library sends for each command, and what it makes of the answers.
#include <gtest/gtest.h>

#include <optional>

#include "client/kmctl/values.h"
#include "client/lib/capabilities.h"
#include "client/lib/keys.h"
#include "client/lib/operation.h"
#include "client/lib/wire.h"
#include "tests/client/fake_tee.h"

namespace {

using namespace keymaster;
using namespace keymaster::client;
using kmctl::parse_hex;
using kmctl::to_hex;

constexpr std::uint32_t error_word(std::int32_t error) {
  return static_cast<std::uint32_t>(error);
}

const bytes no_parameters = parse_hex("00000000");

class CommandsTest : public testing::Test {
 protected:
  void SetUp() override {
    fake_tee::reset();
    tee.emplace("embedded:/nowhere");
    ta.emplace(*tee);
  }
  void TearDown() override {
    ta.reset();
    tee.reset();
    EXPECT_EQ(fake_tee::now().open_sessions, 0);
    EXPECT_EQ(fake_tee::now().open_contexts, 0);
  }

  static void prepare(const fake_tee::answer& answer) { fake_tee::now().answers.push_back(answer); }
  static const fake_tee::arrival& last() { return fake_tee::now().arrivals.back(); }
  static std::size_t count() { return fake_tee::now().arrivals.size(); }

  operation begin(std::uint32_t handle) {
    prepare({.b = handle, .body = no_parameters});
    return operation::begin(*ta, KM_PURPOSE_SIGN, bytes{1, 2, 3}, {});
  }

  std::optional<connection> tee;
  std::optional<session> ta;
};

TEST(ConnectionTest, AnEmptyNameTakesTheDefaultTee) {
  fake_tee::reset();
  { const connection tee; }
  EXPECT_EQ(fake_tee::now().connected_to, "(default)");
}

TEST(ConnectionTest, RefusalsAreConnectionErrorsAndLeaveNothingOpen) {
  fake_tee::reset();
  fake_tee::now().connect_result = TEEC_ERROR_BUSY;
  try {
    const connection tee("embedded:/x");
    FAIL();
  } catch (const error& refused) {
    EXPECT_EQ(refused.kind(), error_kind::connection);
    EXPECT_EQ(refused.facts().tee_result, TEEC_ERROR_BUSY);
  }
  fake_tee::reset();
  fake_tee::now().open_result = TEEC_ERROR_ITEM_NOT_FOUND;
  try {
    connection tee("embedded:/x");
    const session ta(tee);
    FAIL();
  } catch (const error& refused) {
    EXPECT_EQ(refused.facts().step, "open_session");
    EXPECT_EQ(refused.facts().tee_origin, TEEC_ORIGIN_TEE);
  }
  EXPECT_EQ(fake_tee::now().open_contexts, 0);
  EXPECT_EQ(fake_tee::now().open_sessions, 0);
}

TEST_F(CommandsTest, GenerateSendsTheBareParametersAndOffersRoomForTheLargestBlob) {
  prepare({.body = {7, 7, 7}});
  const auto description = authorizations{}.algorithm(KM_ALGORITHM_RSA).key_size(2048).rsa_public_exponent(65537);
  EXPECT_EQ(generate_key(*ta, description), (bytes{7, 7, 7}));
  EXPECT_EQ(last().command, 13U);
  EXPECT_EQ(last().types, 0x0653U);
  EXPECT_EQ(last().a, 0U);
  EXPECT_EQ(last().b, 0U);
  EXPECT_EQ(last().request, description.marshal());
  // The key data of RSA-2048 has at most 1196 bytes; the TA adds one record of 24 for the origin.
  EXPECT_GE(last().capacity, 101U + 1196U + description.marshalled_size() + 24U);
}

TEST_F(CommandsTest, RoomForABlobFollowsTheKey) {
  struct row {
    std::uint32_t bits;
    std::size_t key_data;
  };
  for (const auto& [bits, key_data] :
       {row{512, 328}, row{2048, 1196}, row{4096, 2348}, row{8192, 4652}, row{521, 214}, row{256, 112}}) {
    const auto description = authorizations{}.key_size(bits);
    EXPECT_GE(sealed_size_limit(description), 101 + key_data + description.marshalled_size() + 24) << bits;
    EXPECT_LE(sealed_size_limit(description), 101 + key_data + description.marshalled_size() + 1000) << bits;
  }
  EXPECT_LT(sealed_size_limit(authorizations{}.key_size(UINT32_MAX)), 20000U);
}

TEST_F(CommandsTest, ImportSendsParametersAndMaterialAndReadsBlobAndCharacteristics) {
  bytes answer;
  append_block(answer, bytes{9, 8, 7, 6, 5});
  append_block(answer, authorizations{}.key_size(1024).marshal());
  prepare({.body = answer});
  const auto description = authorizations{}.algorithm(KM_ALGORITHM_RSA);
  const bytes material(100, 0x42);
  const imported_key key = import_key(*ta, description, material);
  EXPECT_EQ(key.blob, (bytes{9, 8, 7, 6, 5}));
  EXPECT_EQ(key.characteristics, authorizations{}.key_size(1024));
  bytes request;
  append_block(request, description.marshal());
  append_bytes(request, material);
  EXPECT_EQ(last().command, 19U);
  EXPECT_EQ(last().types, 0x0653U);
  EXPECT_EQ(last().request, request);
}

TEST_F(CommandsTest, AMalformedImportAnswerIsAFormatError) {
  prepare({.body = parse_hex("05000000aabb")});
  EXPECT_THROW((void)import_key(*ta, {}, bytes{1}), format_error);
}

TEST_F(CommandsTest, CharacteristicsAskForTheSizeFirst) {
  const auto list = authorizations{}.key_size(1024).no_auth_required();
  prepare({.b = 52});
  prepare({.body = list.marshal()});
  const application app{.id = {1, 2}, .data = {3}};
  EXPECT_EQ(get_characteristics(*ta, bytes{5, 5, 5, 5}, app), list);
  ASSERT_EQ(count(), 2U);
  EXPECT_EQ(fake_tee::now().arrivals[0].command, 14U);
  EXPECT_EQ(fake_tee::now().arrivals[0].types, 0x0053U);
  EXPECT_EQ(to_hex(fake_tee::now().arrivals[0].request),
            "0400000005050505"
            "020000000102"
            "0100000003");
  EXPECT_EQ(last().command, 15U);
  EXPECT_EQ(last().types, 0x0653U);
  EXPECT_EQ(last().capacity, 52U);
  EXPECT_EQ(last().request, fake_tee::now().arrivals[0].request);
}

TEST_F(CommandsTest, DeleteSendsTheBlobBehindItsLength) {
  delete_key(*ta, bytes{0xAA, 0xBB});
  EXPECT_EQ(last().command, 21U);
  EXPECT_EQ(last().types, 0x0053U);
  EXPECT_EQ(to_hex(last().request), "02000000aabb");
  delete_all_keys(*ta);
  EXPECT_EQ(last().command, 22U);
  EXPECT_EQ(last().types, 0x0003U);
}

TEST_F(CommandsTest, BothLevelsOfAFailureAreKeptApart) {
  prepare({.a = error_word(-33)});
  try {
    (void)export_key(*ta, bytes{1});
    FAIL();
  } catch (const error& refused) {
    EXPECT_EQ(refused.kind(), error_kind::keymaster);
    EXPECT_EQ(refused.facts().step, "export_key");
    EXPECT_EQ(refused.facts().tee_result, TEEC_SUCCESS);
    EXPECT_EQ(refused.facts().keymaster_error, KM_ERROR_INVALID_KEY_BLOB);
  }
  prepare({.a = error_word(-1000), .result = 0xFFFF3071});
  try {
    (void)export_key(*ta, bytes{1});
    FAIL();
  } catch (const error& failed) {
    EXPECT_EQ(failed.kind(), error_kind::tee);
    EXPECT_EQ(failed.facts().tee_result, 0xFFFF3071U);
    EXPECT_EQ(failed.facts().tee_origin, TEEC_ORIGIN_TRUSTED_APP);
    EXPECT_EQ(failed.facts().keymaster_error, KM_ERROR_UNKNOWN_ERROR);
  }
}

TEST_F(CommandsTest, AWordThatTheTaLeftAsItWasIsNoKeymasterError) {
  prepare({.a = 2, .result = TEEC_ERROR_BAD_PARAMETERS});  // begin with purpose 2, refused before its handler
  try {
    (void)operation::begin(*ta, KM_PURPOSE_SIGN, bytes{1}, {});
    FAIL();
  } catch (const error& failed) {
    EXPECT_EQ(failed.facts().keymaster_error, KM_ERROR_OK);
  }
}

TEST_F(CommandsTest, BeginSendsPurposeBlobAndParametersWithTheApplication) {
  prepare({.b = 77, .body = no_parameters});
  const auto parameters = authorizations{}.digest({KM_DIGEST_SHA_2_256});
  const bytes id{0x0A};
  {
    auto op = operation::begin(*ta, KM_PURPOSE_VERIFY, bytes{1, 2}, parameters, {.id = id, .data = {}});
    EXPECT_EQ(op.handle(), 77U);
    EXPECT_EQ(last().command, 16U);
    EXPECT_EQ(last().a, 3U);
    EXPECT_EQ(last().b, 0U);
    EXPECT_GE(last().capacity, 44U);
    bytes request;
    append_block(request, bytes{1, 2});
    append_block(request, authorizations(parameters).application_id(id).marshal());
    EXPECT_EQ(last().request, request);
  }
}

TEST_F(CommandsTest, ADroppedOperationIsAborted) {
  { const auto op = begin(1234); }
  ASSERT_EQ(count(), 2U);
  EXPECT_EQ(last().command, 23U);
  EXPECT_EQ(last().types, 0x0003U);
  EXPECT_EQ(last().a, 1234U);
}

TEST_F(CommandsTest, AMovedOperationIsAbortedOnce) {
  {
    auto first = begin(1);
    auto second = std::move(first);
    auto third = begin(2);
    third = std::move(second);  // ends operation 2
    EXPECT_EQ(last().command, 23U);
    EXPECT_EQ(last().a, 2U);
    EXPECT_EQ(third.handle(), 1U);
  }
  EXPECT_EQ(count(), 4U);
  EXPECT_EQ(last().a, 1U);
}

TEST_F(CommandsTest, AFinishedOperationIsNotAborted) {
  {
    auto op = begin(5);
    bytes answer;
    append_block(answer, bytes{0xAB, 0xCD});
    append_block(answer, no_parameters);
    prepare({.body = answer});
    EXPECT_EQ(op.finish().output, (bytes{0xAB, 0xCD}));
    EXPECT_EQ(to_hex(last().request),
              "00000000"
              "04000000"
              "00000000");
    EXPECT_GE(last().capacity, 12U + 1024U);
    EXPECT_THROW(op.update(bytes{1}), std::logic_error);
    EXPECT_THROW(op.finish(), std::logic_error);
  }
  EXPECT_EQ(last().command, 18U);
}

TEST_F(CommandsTest, AnOperationThatTheTaEndedIsNotAborted) {
  {
    auto op = begin(5);
    prepare({.a = error_word(KM_ERROR_INVALID_INPUT_LENGTH)});
    EXPECT_THROW(op.update(bytes{1}), error);
  }
  EXPECT_EQ(last().command, 17U);
}

TEST_F(CommandsTest, AnOperationWhoseRequestDidNotReachTheTaIsStillAborted) {
  {
    auto op = begin(5);
    prepare({.result = TEEC_ERROR_OUT_OF_MEMORY, .origin = TEEC_ORIGIN_API});
    EXPECT_THROW(op.update(bytes{1}), error);
  }
  EXPECT_EQ(last().command, 23U);
}

TEST_F(CommandsTest, AnUnreadableBeginAnswerEndsTheOperation) {
  prepare({.b = 9, .body = parse_hex("01000000")});
  EXPECT_THROW((void)operation::begin(*ta, KM_PURPOSE_SIGN, bytes{1}, {}), format_error);
  EXPECT_EQ(last().command, 23U);
  EXPECT_EQ(last().a, 9U);
}

TEST_F(CommandsTest, LongInputGoesInChunks) {
  auto op = begin(1);
  const bytes input(chunk_size + 10, 0x33);
  prepare({.b = chunk_size, .body = {1}});
  prepare({.b = 10, .body = {2}});
  EXPECT_EQ(op.update(input), (bytes{1, 2}));
  EXPECT_EQ(fake_tee::now().arrivals[1].request.size(), 4 + chunk_size + 8);
  EXPECT_EQ(last().request.size(), 4U + 10U + 8U);
  EXPECT_GE(last().capacity, 10U + 32U);
}

TEST_F(CommandsTest, WhatTheTaLeavesIsOfferedAgain) {
  auto op = begin(1);
  prepare({.b = 3});
  prepare({.b = 2});
  op.update(bytes{1, 2, 3, 4, 5});
  EXPECT_EQ(to_hex(last().request),
            "020000000405"
            "04000000"
            "00000000");
}

TEST_F(CommandsTest, InputThatTheTaDoesNotTakeIsAnErrorAndNotALoop) {
  auto op = begin(1);
  prepare({.b = 0});
  try {
    op.update(bytes{1});
    FAIL();
  } catch (const error& refused) {
    EXPECT_EQ(refused.facts().keymaster_error, KM_ERROR_INVALID_INPUT_LENGTH);
  }
  EXPECT_EQ(last().command, 23U);
}

TEST_F(CommandsTest, AStreamEndsWithItsSource) {
  auto op = begin(1);
  prepare({.b = 4, .body = {1}});
  prepare({.b = 2, .body = {2}});
  int left = 2;
  bytes output;
  stream(
      op,
      [&](std::span<std::uint8_t> buffer) -> std::size_t {
        EXPECT_EQ(buffer.size(), chunk_size);
        return left-- == 2 ? 4 : (left == 0 ? 2 : 0);
      },
      [&](byte_view piece) { append_bytes(output, piece); });
  EXPECT_EQ(output, (bytes{1, 2}));
}

TEST_F(CommandsTest, TheNonceIsWhatBeginAnswered) {
  const bytes nonce{1, 2, 3};
  prepare({.b = 1, .body = authorizations{}.nonce(nonce).marshal()});
  EXPECT_EQ(operation::begin(*ta, KM_PURPOSE_ENCRYPT, bytes{1}, {}).nonce(), nonce);
  EXPECT_TRUE(begin(2).nonce().empty());
}

TEST_F(CommandsTest, AssociatedDataGoesInChunksWithoutInput) {
  auto op = begin(7);
  const bytes data(chunk_size + 1, 0x44);
  const auto every_time = authorizations{}.auth_token(bytes{9});
  op.add_associated_data(data, every_time);
  ASSERT_EQ(count(), 3U);
  for (std::size_t i = 1; i < 3; ++i) {
    const byte_view piece = i == 1 ? byte_view(data).first(chunk_size) : byte_view(data).last(1);
    bytes request;
    append_block(request, {});
    append_block(request, authorizations(every_time).associated_data(piece).marshal());
    EXPECT_EQ(fake_tee::now().arrivals[i].command, 17U);
    EXPECT_EQ(fake_tee::now().arrivals[i].request, request);
  }
  op.add_associated_data({});
  EXPECT_EQ(count(), 3U) << "no data is nothing to send";
}

TEST_F(CommandsTest, CapabilitiesAskForExactlyTheAnnouncedSize) {
  prepare({.a = 1});
  prepare({.body = parse_hex("01000000")});
  prepare({.b = 1});                         // import formats
  prepare({.body = parse_hex("01000000")});  //
  prepare({.b = 0});                         // export formats: an empty list is not asked for
  for (int purpose = 0; purpose < 3; ++purpose) {
    prepare({.a = error_word(KM_ERROR_UNSUPPORTED_PURPOSE)});
  }
  prepare({.b = 0});  // verify: no block modes
  prepare({.b = 2});
  prepare({.body = parse_hex("0300000005000000")});
  prepare({.b = 0});
  const auto all = get_capabilities(*ta);
  ASSERT_EQ(all.size(), 1U);
  EXPECT_EQ(all[0].import_formats, std::vector<std::uint32_t>{1});
  EXPECT_TRUE(all[0].export_formats.empty());
  ASSERT_EQ(all[0].purposes.size(), 1U);
  EXPECT_EQ(all[0].purposes[0].purpose, 3U);
  EXPECT_EQ(all[0].purposes[0].paddings, (std::vector<std::uint32_t>{3, 5}));
  EXPECT_EQ(fake_tee::now().arrivals[1].types, 0x0603U);
  EXPECT_EQ(fake_tee::now().arrivals[1].capacity, 4U);
  EXPECT_EQ(fake_tee::now().arrivals[10].capacity, 8U);
}

TEST_F(CommandsTest, AnAlgorithmWithoutFormatsAndPurposesIsListedWithNone) {
  prepare({.a = 1});
  prepare({.body = parse_hex("20000000")});
  prepare({.a = error_word(KM_ERROR_UNSUPPORTED_ALGORITHM)});
  prepare({.a = error_word(KM_ERROR_UNSUPPORTED_ALGORITHM)});
  for (int purpose = 0; purpose < 4; ++purpose) {
    prepare({.a = error_word(KM_ERROR_UNSUPPORTED_PURPOSE)});
  }
  const auto all = get_capabilities(*ta);
  ASSERT_EQ(all.size(), 1U);
  EXPECT_EQ(all[0].algorithm, KM_ALGORITHM_AES);
  EXPECT_TRUE(all[0].import_formats.empty());
  EXPECT_TRUE(all[0].purposes.empty());
}

TEST_F(CommandsTest, OtherRefusalsOfACapabilityAreErrors) {
  prepare({.a = 1});
  prepare({.body = parse_hex("20000000")});
  prepare({.a = error_word(KM_ERROR_UNKNOWN_ERROR)});
  EXPECT_THROW((void)get_capabilities(*ta), error);
}

TEST_F(CommandsTest, AnAbsurdTableIsAFormatError) {
  prepare({.a = 0x40000000});
  EXPECT_THROW((void)get_capabilities(*ta), format_error);
}

}  // namespace
