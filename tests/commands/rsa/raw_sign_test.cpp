// Signing without a digest: the client's own block, or its message in a PKCS#1 v1.5 block.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

const param_list& unpadded() {
  static const param_list params = signature(KM_DIGEST_NONE, KM_PAD_NONE);
  return params;
}
const param_list& pkcs1() {
  static const param_list params = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN);
  return params;
}

/// The message at the end of a block of `size` bytes, behind zeros.
bytes right_aligned(const bytes& message, std::size_t size) {
  return join({bytes(size - message.size()), message});
}

/// The block 00 01 FF ... FF 00 message.
bytes pkcs1_block(const bytes& message, std::size_t size) {
  return join({{0, 1}, bytes(size - message.size() - 3, 0xFF), {0}, message});
}

class RawSignTest : public CommandTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(1024);

  /// A message of `size` bytes that is a number below the modulus.
  static bytes below_modulus(std::size_t size, std::uint32_t seed = 1) {
    bytes message = pattern(size, seed);
    if (!message.empty()) message.front() &= 0x7F;
    return message;
  }
};

TEST_F(RawSignTest, AnUnpaddedMessageStandsAtTheEndOfTheBlock) {
  for (const std::size_t size : {1U, 2U, 20U, 127U, 128U}) {
    SCOPED_TRACE(size);
    const bytes message = below_modulus(size);
    const finish_answer done = succeeds([&] { return client().sign(blob, unpadded(), message); });
    EXPECT_EQ(to_hex(done.data), to_hex(key.private_operation(right_aligned(message, 128))));
  }
}

TEST_F(RawSignTest, NoMessageAtAllIsTheNumberZero) {
  EXPECT_EQ(succeeds([&] { return client().sign(blob, unpadded(), {}); }).data, bytes(128));
}

TEST_F(RawSignTest, APkcs1MessageStandsBehindItsPadding) {
  for (const std::size_t size : {0U, 1U, 35U, 116U, 117U}) {
    SCOPED_TRACE(size);
    const bytes message = pattern(size);
    const finish_answer done = succeeds([&] { return client().sign(blob, pkcs1(), message); });
    EXPECT_EQ(to_hex(key.public_operation(done.data)), to_hex(pkcs1_block(message, 128)));
  }
}

TEST_F(RawSignTest, WithTheDigestInfoOfTheClientItIsAPkcs1Signature) {
  const bytes digest_info_prefix = from_hex("3031300d060960864801650304020105000420");
  const bytes abc = from_text("abc");  // and its SHA-256, FIPS 180-4
  const bytes digest = from_hex("ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  const bytes made = client().sign(blob, pkcs1(), join({digest_info_prefix, digest})).data;
  EXPECT_TRUE(key.verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, abc, made));
}

TEST_F(RawSignTest, AMessageComesInAnyNumberOfPieces) {
  const bytes message = below_modulus(128);
  for (const std::size_t step : {1U, 7U, 64U, 127U}) {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, unpadded());
    for (std::size_t at = 0; at < message.size(); at += step) {
      const auto end = message.begin() + static_cast<std::ptrdiff_t>(std::min(message.size(), at + step));
      EXPECT_TRUE(client().update(handle, {message.begin() + static_cast<std::ptrdiff_t>(at), end}).ok());
    }
    EXPECT_EQ(client().finish(handle).data, key.private_operation(message));
  }
}

TEST_F(RawSignTest, AShortNumberIsASignatureOfFullLengthAllTheSame) {
  // The platform answers numbers without leading zeros; a signature has them.
  unsigned found = 0;
  for (std::uint32_t seed = 1; found < 2 && seed < 4000; ++seed) {
    const bytes message = below_modulus(32, seed);
    const bytes expected = key.private_operation(right_aligned(message, 128));
    if (expected.front() != 0) continue;
    ++found;
    const bytes made = client().sign(blob, unpadded(), message).data;
    EXPECT_EQ(to_hex(made), to_hex(expected));
    EXPECT_EQ(key.public_operation(made), right_aligned(message, 128));
  }
  EXPECT_EQ(found, 2U);
}

TEST_F(RawSignTest, MoreThanTheBlockHoldsIsRefusedWithTheWouldBeTotal) {
  struct limit {
    unsigned bits;
    const param_list& params;
    std::size_t most;
  };
  const hosted_tee::accounting before = tee.accounting();
  for (const limit& each : {limit{1024, unpadded(), 128},
                            {1024, pkcs1(), 117},
                            {2048, unpadded(), 256},
                            {2048, pkcs1(), 245},
                            {512, pkcs1(), 53}}) {
    const bytes key_blob = import_fixed(each.bits);
    for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
      SCOPED_TRACE(fmt::format("{} bits, purpose {}, limit {}", each.bits, purpose, each.most));
      const char* const verb = purpose == KM_PURPOSE_SIGN ? "sign" : "verify";
      const failure expected =
          refused(KM_ERROR_INVALID_INPUT_LENGTH,
                  {fmt::format("Input too long to {}, key_size {}, input {}B", verb, each.bits, each.most + 1),
                   "Update failed"});
      std::uint32_t handle = client().must_begin(purpose, key_blob, each.params);
      EXPECT_EQ(expect_lost(expected, handle, before, [&] { return client().update(handle, bytes(each.most + 1)); }).b,
                0U);
      handle = client().must_begin(purpose, key_blob, each.params);
      EXPECT_EQ(client().update(handle, bytes(each.most)).b, each.most);
      EXPECT_EQ(expect_lost(expected, handle, before, [&] { return client().update(handle, bytes(1)); }).b, 0U);
    }
  }
}

TEST_F(RawSignTest, AFullBlockTakesAnEmptyUpdate) {
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, unpadded());
  EXPECT_TRUE(client().update(handle, bytes(128)).ok());
  EXPECT_TRUE(client().update(handle, bytes{}).ok());
  EXPECT_TRUE(client().finish(handle).ok());
}

TEST_F(RawSignTest, ANumberThatIsNotBelowTheModulusIsAnInvalidArgument) {
  bytes below = key.component(rsa_n);
  below.back() -= 1;  // the modulus is odd
  const hosted_tee::accounting before = tee.accounting();
  for (const bytes& message : {key.component(rsa_n), bytes(128, 0xFF)}) {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, unpadded());
    EXPECT_TRUE(client().update(handle, message).ok());
    (void)expect_lost(refused(KM_ERROR_INVALID_ARGUMENT, {"Finish failed"}), handle, before,
                      [&] { return client().finish(handle); });
  }
  EXPECT_EQ(client().sign(blob, unpadded(), below).data, key.private_operation(below));
}

TEST_F(RawSignTest, OnlyBadParametersOfThePlatformAreTheClientsFault) {
  const hosted_tee::accounting before = tee.accounting();
  std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1());
  tee.world().faults().fail_call("TEE_AsymmetricDecrypt", 1, TEE_ERROR_BAD_PARAMETERS);
  (void)expect_lost(refused(KM_ERROR_INVALID_ARGUMENT, {"Finish failed"}), handle, before,
                    [&] { return client().finish(handle); });
  handle = client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1());
  tee.world().faults().fail_call("TEE_AsymmetricDecrypt", 1, TEE_ERROR_OUT_OF_MEMORY);
  (void)expect_lost(broken(TEEC_ERROR_OUT_OF_MEMORY, {"TEE_AsymmetricDecrypt return 0xffff000c", "Finish failed"}),
                    handle, before, [&] { return client().finish(handle); });
}

TEST_F(RawSignTest, AModulusWithALeadingZeroHasABlockOneByteLonger) {
  rsa_components padded = key.components();
  padded[rsa_n].insert(padded[rsa_n].begin(), 0);
  const bytes longer = client().must_import(rsa_key(0).remove(KM_TAG_KEY_SIZE), rsa_material(padded));
  const bytes message = pattern(118);
  const bytes made = client().sign(longer, pkcs1(), message).data;
  ASSERT_EQ(made.size(), 129U);
  EXPECT_EQ(made.front(), 0);
  // The block's 00 falls away with the number's leading zeros: 01 FF ... is what is signed.
  const bytes block = pkcs1_block(message, 129);
  EXPECT_EQ(to_hex(key.public_operation({made.begin() + 1, made.end()})),
            to_hex(bytes(block.begin() + 1, block.end())));
}

}  // namespace
}  // namespace testing_support
