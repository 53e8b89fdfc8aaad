// RSA encryption: what libcrypto decrypts, how much fits, and what stands in front of a short number.
#include <fmt/format.h>

#include <algorithm>

#include "tests/commands/rsa/cipher_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class RsaEncryptTest : public RsaCipherTest {};

TEST_F(RsaEncryptTest, LibcryptoDecryptsWhatTheTaEncryptsUpToTheLimitOfThePadding) {
  for (const unsigned bits : {1024U, 2048U}) {
    const rsa_test_key& pair = rsa_test_key::of_bits(bits);
    const bytes with = import_fixed(bits, rsa_cipher_key(bits));
    const auto k = static_cast<int>(pair.size());
    for (const cipher_scheme& scheme : padded_schemes) {
      for (const int size : {0, 1, 17, k - scheme.overhead - 1, k - scheme.overhead}) {
        if (size < 0 || size > k - scheme.overhead) continue;
        SCOPED_TRACE(
            fmt::format("{} bits, padding {}, digest {}, {} bytes", bits, scheme.padding, scheme.digest, size));
        const bytes message = pattern(static_cast<std::size_t>(size));
        const cipher_answer made = succeeds([&] {
          return run_cipher(client(), KM_PURPOSE_ENCRYPT, with, signature(scheme.digest, scheme.padding),
                            cut_every(message, 7));
        });
        EXPECT_EQ(made.data.size(), pair.size());
        EXPECT_EQ(pair.decrypt(scheme.digest, scheme.padding, made.data), message);
        EXPECT_EQ(made.out_params, u32(0));
      }
    }
  }
}

TEST_F(RsaEncryptTest, AMessageBeyondTheLimitOfThePaddingIsRefusedAtTheEnd) {
  for (const unsigned bits : {512U, 680U, 688U, 1024U, 2048U}) {
    const bytes with = import_fixed(bits, rsa_cipher_key(bits));
    for (const cipher_scheme& scheme : padded_schemes) {
      const int limit = static_cast<int>(bits / 8) - scheme.overhead;
      // A short key leaves less than nothing for a long digest: not even an empty message fits.
      for (const int size : {std::max(limit + 1, 0), static_cast<int>(bits / 8)}) {
        SCOPED_TRACE(
            fmt::format("{} bits, padding {}, digest {}, {} bytes", bits, scheme.padding, scheme.digest, size));
        expect_finish_fails(
            refused(KM_ERROR_INVALID_INPUT_LENGTH, {fmt::format("Message too long, max {}B, got {}B", limit, size)}),
            KM_PURPOSE_ENCRYPT, with, signature(scheme.digest, scheme.padding), bytes(static_cast<std::size_t>(size)));
      }
    }
  }
}

TEST_F(RsaEncryptTest, TheLimitsOf2048BitsAre245And190Bytes) {
  const bytes with = import_fixed(2048, rsa_cipher_key(2048));
  const param_list pkcs1 = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT),
                   oaep = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP);
  EXPECT_TRUE(run(KM_PURPOSE_ENCRYPT, with, pkcs1, pattern(245)).ok());
  EXPECT_EQ(run(KM_PURPOSE_ENCRYPT, with, pkcs1, pattern(246)).error, KM_ERROR_INVALID_INPUT_LENGTH);
  EXPECT_TRUE(run(KM_PURPOSE_ENCRYPT, with, oaep, pattern(190)).ok());
  EXPECT_EQ(run(KM_PURPOSE_ENCRYPT, with, oaep, pattern(191)).error, KM_ERROR_INVALID_INPUT_LENGTH);
}

TEST_F(RsaEncryptTest, TwoEncryptionsOfAMessageDiffer) {
  for (const cipher_scheme& scheme : padded_schemes) {
    if (scheme.overhead > 128 - 5) continue;
    const param_list params = signature(scheme.digest, scheme.padding);
    EXPECT_NE(run(KM_PURPOSE_ENCRYPT, blob, params, pattern(5)).data,
              run(KM_PURPOSE_ENCRYPT, blob, params, pattern(5)).data);
  }
}

TEST_F(RsaEncryptTest, WithoutPaddingTheMessageIsANumberAndTheResultHasTheModulusSize) {
  for (const std::size_t size : {0U, 1U, 20U, 127U, 128U}) {
    SCOPED_TRACE(size);
    bytes message = pattern(size);
    if (size == 128) message.front() &= 0x7F;
    EXPECT_EQ(succeeds([&] { return run(KM_PURPOSE_ENCRYPT, blob, bare, message); }).data,
              key.public_operation(join({bytes(128 - size), message})));
  }
}

TEST_F(RsaEncryptTest, ASmallPowerStandsAtTheEndOfTheBlockBehindZeros) {
  // With the exponent 3 a short message stays below the modulus.
  rsa_components cubing = key.components();
  cubing[rsa_e] = {3};
  const bytes with =
      client().must_import(rsa_cipher_key(1024).remove(KM_TAG_RSA_PUBLIC_EXPONENT), rsa_material(cubing));
  EXPECT_EQ(run(KM_PURPOSE_ENCRYPT, with, bare, {2}).data, join({bytes(127), {8}}));
  EXPECT_EQ(run(KM_PURPOSE_ENCRYPT, with, bare, {1, 0}).data, join({bytes(124), {1, 0, 0, 0}}));
  EXPECT_EQ(run(KM_PURPOSE_ENCRYPT, with, bare, {}).data, bytes(128));
}

TEST_F(RsaEncryptTest, MoreThanABlockIsRefusedWithTheWouldBeTotal) {
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}) {
    const char* const verb = purpose == KM_PURPOSE_ENCRYPT ? "encrypt" : "decrypt";
    for (const unsigned bits : {512U, 1024U, 2048U}) {
      const bytes with = import_fixed(bits, rsa_cipher_key(bits));
      for (const param_list& params : {bare, signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT),
                                       signature(KM_DIGEST_SHA1, KM_PAD_RSA_OAEP)}) {
        const auto too_long = [&](std::size_t total) {
          return refused(
              KM_ERROR_INVALID_INPUT_LENGTH,
              {fmt::format("Input too long to {}, key_size {}, input {}B", verb, bits, total), "Update failed"});
        };
        const std::size_t k = bits / 8;
        std::uint32_t handle = client().must_begin(purpose, with, params);
        EXPECT_EQ(expect_lost(too_long(k + 1), handle, before, [&] { return client().update(handle, bytes(k + 1)); }).b,
                  0U);
        handle = client().must_begin(purpose, with, params);
        const answer whole = succeeds([&] { return client().update(handle, bytes(k), {}, 0); });
        EXPECT_EQ(whole.b, k);
        EXPECT_EQ(whole.size, 0U);
        EXPECT_TRUE(client().update(handle, {}).ok());
        EXPECT_EQ(expect_lost(too_long(k + 50), handle, before, [&] { return client().update(handle, bytes(50)); }).b,
                  0U);
      }
    }
  }
}

TEST_F(RsaEncryptTest, ANumberThatIsNotBelowTheModulusIsAnInvalidArgument) {
  for (const bytes& number : {key.component(rsa_n), bytes(128, 0xFF)}) {
    expect_finish_fails(refused(KM_ERROR_INVALID_ARGUMENT, {}), KM_PURPOSE_ENCRYPT, blob, bare, number);
    expect_finish_fails(refused(KM_ERROR_INVALID_ARGUMENT, {}), KM_PURPOSE_DECRYPT, blob, bare, number);
  }
}

TEST_F(RsaEncryptTest, FinishTakesNoFurtherData) {
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_ENCRYPT, blob, bare);
  EXPECT_TRUE(client().update(handle, {5}).ok());
  const finish_answer done = succeeds([&] { return client().finish(handle, pattern(300)); });
  EXPECT_EQ(done.data, key.public_operation(join({bytes(127), {5}})));
}

TEST_F(RsaEncryptTest, OtherFailuresOfThePlatformAreItsResult) {
  struct platform_failure {
    std::uint32_t purpose;
    const char* call;
    const char* line;
  };
  for (const platform_failure& row :
       {platform_failure{KM_PURPOSE_ENCRYPT, "TEE_AsymmetricEncrypt", "TEE_AsymmetricEncrypt failed with 0xffff000c"},
        {KM_PURPOSE_DECRYPT, "TEE_AsymmetricDecrypt", "TEE_AsymmetricDecrypt failed with 0xffff000c"}}) {
    for (const auto& [result, expected] :
         {std::pair{TEE_ERROR_OUT_OF_MEMORY, broken(TEEC_ERROR_OUT_OF_MEMORY, {row.line, "Finish failed"})},
          {TEE_ERROR_BAD_PARAMETERS, refused(KM_ERROR_INVALID_ARGUMENT, {"Finish failed"})}}) {
      const hosted_tee::accounting before = tee.accounting();
      const std::uint32_t handle = client().must_begin(row.purpose, blob, bare);
      tee.world().faults().fail_call(row.call, 1, result);
      (void)expect_lost(expected, handle, before, [&] { return client().finish(handle); });
    }
  }
}

TEST_F(RsaEncryptTest, AModulusWithALeadingZeroGivesCiphertextsOneByteLonger) {
  rsa_components padded = key.components();
  padded[rsa_n].insert(padded[rsa_n].begin(), 0);
  const bytes with = client().must_import(rsa_cipher_key(0).remove(KM_TAG_KEY_SIZE), rsa_material(padded));
  const bytes message = pattern(40);
  for (const cipher_scheme& scheme : padded_schemes) {
    if (scheme.overhead > 128 - 40) continue;
    const param_list params = signature(scheme.digest, scheme.padding);
    const bytes made = run(KM_PURPOSE_ENCRYPT, with, params, message).data;
    ASSERT_EQ(made.size(), 129U);
    EXPECT_EQ(made.front(), 0);
    EXPECT_EQ(key.decrypt(scheme.digest, scheme.padding, {made.begin() + 1, made.end()}), message);
    EXPECT_EQ(run(KM_PURPOSE_DECRYPT, with, params, made).data, message);
  }
  EXPECT_EQ(run(KM_PURPOSE_ENCRYPT, with, bare, {5}).data, join({{0}, key.public_operation(join({bytes(127), {5}}))}));
}

}  // namespace
}  // namespace testing_support
