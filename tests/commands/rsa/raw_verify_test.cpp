// Verifying without a digest: the recovered block must be one byte shorter than the modulus and equal the expected
// block behind its first byte, which is never compared.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class RawVerifyTest : public CommandTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(1024);
  const param_list unpadded = signature(KM_DIGEST_NONE, KM_PAD_NONE);
  const param_list pkcs1 = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN);

  /// A block of 128 bytes that begins so.
  static bytes block_with(bytes first_bytes) {
    bytes block = pattern(128);
    std::copy(first_bytes.begin(), first_bytes.end(), block.begin());
    return block;
  }
  bytes pkcs1_signature(const bytes& message) {
    return key.private_operation(join({{0, 1}, bytes(128 - message.size() - 3, 0xFF), {0}, message}));
  }

  void expect_wrong(const param_list& params, const bytes& message, const bytes& made) {
    expect_failure(refused(KM_ERROR_VERIFICATION_FAILED, {"Finish failed"}),
                   [&] { return client().verify(blob, params, message, made); });
  }
};

TEST_F(RawVerifyTest, APkcs1SignatureOfTheMessageHolds) {
  for (const std::size_t size : {0U, 1U, 35U, 117U}) {
    const bytes message = pattern(size);
    EXPECT_TRUE(succeeds([&] { return client().verify(blob, pkcs1, message, pkcs1_signature(message)); }).data.empty());
  }
}

TEST_F(RawVerifyTest, WhatTheTaSignedHolds) {
  const bytes message = from_text("raw but padded");
  EXPECT_TRUE(client().verify(blob, pkcs1, message, client().sign(blob, pkcs1, message).data).ok());
}

TEST_F(RawVerifyTest, APkcs1SignatureOfAnotherMessageDoesNot) {
  const bytes message = from_text("message");
  expect_wrong(pkcs1, from_text("massage"), pkcs1_signature(message));
  expect_wrong(pkcs1, join({message, {0}}), pkcs1_signature(message));
  expect_wrong(pkcs1, {}, pkcs1_signature(message));
  for (const std::size_t offset : {1U, 64U, 127U}) expect_wrong(pkcs1, message, flip(pkcs1_signature(message), offset));
}

TEST_F(RawVerifyTest, TheFirstByteOfTheBlockIsNotComparedAndTheLengthIs) {
  const bytes message = pattern(100);
  bytes block = join({{0, 1}, bytes(25, 0xFF), {0}, message});
  block.front() = 1;  // 128 significant bytes: one too many
  expect_wrong(pkcs1, message, key.private_operation(block));
  block[0] = block[1] = 0;  // 126: one too few
  expect_wrong(pkcs1, message, key.private_operation(block));
}

TEST_F(RawVerifyTest, UnpaddedMessagesHoldOnlyAsWholeBlocksOf127SignificantBytes) {
  struct block_case {
    const char* what;
    bytes block;
    bool holds;
  };
  for (const block_case& each : {block_case{"00 and then not 00", block_with({0x00, 0x01}), true},
                                 {"00 FF", block_with({0x00, 0xFF}), true},
                                 {"00 00", block_with({0x00, 0x00, 0x77}), false},
                                 {"not 00", block_with({0x01, 0x02}), false},
                                 {"all zero", bytes(128), false}}) {
    SCOPED_TRACE(each.what);
    const bytes made = key.private_operation(each.block);
    if (each.holds) {
      (void)succeeds([&] { return client().verify(blob, unpadded, each.block, made); });
    } else {
      expect_wrong(unpadded, each.block, made);
    }
  }
}

TEST_F(RawVerifyTest, AnUnpaddedMessageIsNotMovedToTheEndOfTheBlock) {
  for (const std::size_t size : {1U, 20U, 126U, 127U}) {
    const bytes message = join({{0x42}, pattern(size - 1)});
    expect_wrong(unpadded, message, client().sign(blob, unpadded, message).data);
  }
}

TEST_F(RawVerifyTest, TheFirstByteOfAnUnpaddedMessageIsNotCompared) {
  bytes block = block_with({0x00, 0x01});
  const bytes made = key.private_operation(block);
  block.front() = 0x99;
  (void)succeeds([&] { return client().verify(blob, unpadded, block, made); });
  block.at(1) = 0x02;
  expect_wrong(unpadded, block, made);
}

TEST_F(RawVerifyTest, AShorterMessageMatchesABlockThatEndsInZeros) {
  bytes block(128);
  block.at(1) = 0x21;
  block.at(2) = 0x43;
  const bytes made = key.private_operation(block);
  (void)succeeds([&] { return client().verify(blob, unpadded, {0x00, 0x21, 0x43}, made); });
}

TEST_F(RawVerifyTest, ASignatureThatIsNoNumberBelowTheModulusIsThePlatformsToRefuse) {
  const failure expected =
      broken(TEEC_ERROR_BAD_PARAMETERS, {"AsymmetricEncrypt failed with 0xffff0006\n", "Finish failed"});
  for (const param_list& params : {unpadded, pkcs1}) {
    for (const bytes& made : {key.component(rsa_n), bytes(128, 0xFF), bytes(129, 1), pattern(3000)}) {
      expect_failure(expected, [&] { return client().verify(blob, params, from_text("message"), made); });
    }
  }
}

TEST_F(RawVerifyTest, NoSignatureAtAllIsAWrongOne) {
  expect_wrong(pkcs1, from_text("message"), {});
  expect_wrong(unpadded, from_text("message"), {});
  expect_wrong(unpadded, {}, {});
}

TEST_F(RawVerifyTest, OtherPlatformFailuresAreReturned) {
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, blob, pkcs1);
  tee.world().faults().fail_call("TEE_AsymmetricEncrypt", 1, TEE_ERROR_OUT_OF_MEMORY);
  (void)expect_lost(broken(TEEC_ERROR_OUT_OF_MEMORY, {"AsymmetricEncrypt failed with 0xffff000c\n", "Finish failed"}),
                    handle, before, [&] { return client().finish(handle, bytes(128)); });
}

}  // namespace
}  // namespace testing_support
