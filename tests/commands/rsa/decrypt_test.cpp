// RSA decryption: of what libcrypto encrypts, and of what nobody encrypted.
#include <fmt/format.h>

#include "tests/commands/rsa/cipher_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class RsaDecryptTest : public RsaCipherTest {
 protected:
  const failure invalid = refused(KM_ERROR_INVALID_ARGUMENT, {});
};

TEST_F(RsaDecryptTest, TheTaDecryptsWhatLibcryptoEncryptsToItsOwnLength) {
  for (const unsigned bits : {1024U, 2048U}) {
    const rsa_test_key& pair = rsa_test_key::of_bits(bits);
    const bytes with = import_fixed(bits, rsa_cipher_key(bits));
    const auto k = static_cast<int>(pair.size());
    for (const cipher_scheme& scheme : padded_schemes) {
      for (const int size : {0, 1, 17, k - scheme.overhead}) {
        if (size > k - scheme.overhead || k < scheme.overhead) continue;
        SCOPED_TRACE(
            fmt::format("{} bits, padding {}, digest {}, {} bytes", bits, scheme.padding, scheme.digest, size));
        const bytes message = pattern(static_cast<std::size_t>(size));
        const bytes ciphertext = pair.encrypt(scheme.digest, scheme.padding, message);
        const cipher_answer back = succeeds([&] {
          return run_cipher(client(), KM_PURPOSE_DECRYPT, with, signature(scheme.digest, scheme.padding),
                            cut_every(ciphertext, 50));
        });
        EXPECT_EQ(back.data, message);
      }
    }
  }
}

TEST_F(RsaDecryptTest, LeadingZerosOfAPaddedMessageStay) {
  const bytes message = join({bytes(9), pattern(3), bytes(9)});
  for (const cipher_scheme& scheme : padded_schemes) {
    if (scheme.overhead > 128 - 21) continue;
    EXPECT_EQ(run(KM_PURPOSE_DECRYPT, blob, signature(scheme.digest, scheme.padding),
                  key.encrypt(scheme.digest, scheme.padding, message))
                  .data,
              message);
  }
}

TEST_F(RsaDecryptTest, WithoutPaddingTheResultHasTheModulusSizeAndItsLeadingZeros) {
  for (const unsigned bits : {1024U, 2048U}) {
    const rsa_test_key& pair = rsa_test_key::of_bits(bits);
    const bytes with = import_fixed(bits, rsa_cipher_key(bits));
    const std::size_t k = pair.size();
    for (const std::size_t zeros : {std::size_t{1}, std::size_t{2}, std::size_t{9}, k - 1, k}) {
      SCOPED_TRACE(fmt::format("{} bits, {} zeros", bits, zeros));
      bytes block = join({bytes(zeros), pattern(k - zeros)});
      if (zeros < k) block.at(zeros) |= 1;
      EXPECT_EQ(succeeds([&] { return run(KM_PURPOSE_DECRYPT, with, bare, pair.public_operation(block)); }).data,
                block);
    }
  }
}

TEST_F(RsaDecryptTest, AShortInputWithoutPaddingIsANumber) {
  for (const bytes& number : {bytes{}, bytes{2}, pattern(50)}) {
    EXPECT_EQ(run(KM_PURPOSE_DECRYPT, blob, bare, number).data,
              key.private_operation(join({bytes(128 - number.size()), number})));
  }
}

TEST_F(RsaDecryptTest, WhatIsNotSoPaddedIsAnInvalidArgument) {
  const bytes message = pattern(20);
  for (const cipher_scheme& scheme : padded_schemes) {
    if (scheme.overhead > 128 - 20) continue;
    SCOPED_TRACE(fmt::format("padding {}, digest {}", scheme.padding, scheme.digest));
    const param_list params = signature(scheme.digest, scheme.padding);
    const bytes good = key.encrypt(scheme.digest, scheme.padding, message);
    // 00 03 ... is the padding of no scheme; neither is a block of zeros.
    for (const bytes& block : {join({{0, 3}, bytes(100, 0x77), {0}, pattern(25)}), bytes(128)}) {
      expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, params, key.public_operation(block));
    }
    expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, params, bytes(128, 0xFF));
    for (const std::size_t size : {0U, 1U, 64U, 127U}) {
      expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, params, bytes(good.begin(), good.begin() + size));
    }
    if (scheme.padding == KM_PAD_RSA_OAEP) {
      for (const std::size_t at : {1U, 64U, 127U}) {
        expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, params, flip(good, at));
      }
    }
  }
}

TEST_F(RsaDecryptTest, APkcs1PaddingOfFewerThan8BytesIsNone) {
  const param_list params = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT);
  const auto block = [](std::size_t padding) {
    return join({{0, 2}, bytes(padding, 0x77), {0}, bytes(125 - padding, 0x42)});
  };
  expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, params, key.public_operation(block(7)));
  EXPECT_EQ(run(KM_PURPOSE_DECRYPT, blob, params, key.public_operation(block(8))).data, bytes(117, 0x42));
  // Nor is one that never ends, or one of signatures.
  expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, params,
                      key.public_operation(join({{0, 2}, bytes(126, 0x77)})));
  expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, params,
                      key.public_operation(join({{0, 1}, bytes(100, 0xFF), {0}, pattern(25)})));
}

TEST_F(RsaDecryptTest, OaepOfOneDigestIsNotThatOfAnother) {
  const bytes sealed = key.encrypt(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP, pattern(20));
  for (const std::uint32_t digest : {KM_DIGEST_SHA1, KM_DIGEST_SHA_2_224, KM_DIGEST_SHA_2_384}) {
    expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, signature(digest, KM_PAD_RSA_OAEP), sealed);
  }
}

TEST_F(RsaDecryptTest, DecryptionHasNoLimitsOfItsOwn) {
  // SHA-512 never fits a key of 1024 bits; decryption finds that out as it finds any wrong padding.
  expect_finish_fails(invalid, KM_PURPOSE_DECRYPT, blob, signature(KM_DIGEST_SHA_2_512, KM_PAD_RSA_OAEP),
                      key.public_operation(join({{0}, pattern(127)})));
}

TEST_F(RsaDecryptTest, AGeneratedKeyDecryptsWhatItEncrypted) {
  const bytes made = client().must_generate(rsa_cipher_key(1024)), message = pattern(30);
  for (const cipher_scheme& scheme : padded_schemes) {
    if (scheme.overhead > 128 - 30) continue;
    const param_list params = signature(scheme.digest, scheme.padding);
    EXPECT_EQ(run(KM_PURPOSE_DECRYPT, made, params, run(KM_PURPOSE_ENCRYPT, made, params, message).data).data, message);
  }
}

}  // namespace
}  // namespace testing_support
