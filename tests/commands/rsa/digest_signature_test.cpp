// Signatures over a digest, from the TA to libcrypto and from libcrypto to the TA.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

struct scheme {
  std::uint32_t padding, digest;
};

const std::vector<scheme>& schemes() {
  static const std::vector<scheme> all = [] {
    std::vector<scheme> list;
    for (std::uint32_t digest = KM_DIGEST_MD5; digest <= KM_DIGEST_SHA_2_512; ++digest) {
      list.push_back({KM_PAD_RSA_PKCS1_1_5_SIGN, digest});
      if (digest != KM_DIGEST_MD5) list.push_back({KM_PAD_RSA_PSS, digest});
    }
    return list;
  }();
  return all;
}

class DigestSignatureTest : public CommandTest {
 protected:
  /// sign_in_pieces cuts the message into updates of growing size.
  bytes sign_in_pieces(const bytes& blob, const scheme& with, const bytes& message) {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, signature(with.digest, with.padding));
    for (std::size_t at = 0, size = 0; at < message.size(); at += size, ++size) {
      const std::size_t end = std::min(message.size(), at + size);
      const bytes piece(message.begin() + static_cast<std::ptrdiff_t>(at),
                        message.begin() + static_cast<std::ptrdiff_t>(end));
      EXPECT_EQ(client().update(handle, piece).b, piece.size());
    }
    return client().finish(handle).data;
  }

  void expect_wrong(const bytes& blob, const scheme& with, const bytes& message, const bytes& made) {
    expect_failure(refused(KM_ERROR_VERIFICATION_FAILED, {"Finish failed"}),
                   [&] { return client().verify(blob, signature(with.digest, with.padding), message, made); });
  }
};

TEST_F(DigestSignatureTest, LibcryptoVerifiesWhatTheTaSigns) {
  for (const unsigned bits : {1024U, 2048U}) {
    const rsa_test_key& key = rsa_test_key::of_bits(bits);
    const bytes blob = import_fixed(bits);
    for (const scheme& with : schemes()) {
      for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{700}}) {
        SCOPED_TRACE(fmt::format("{} bits, padding {}, digest {}, {} bytes", bits, with.padding, with.digest, size));
        const bytes message = pattern(size);
        const bytes made = sign_in_pieces(blob, with, message);
        EXPECT_EQ(made.size(), key.size());
        EXPECT_TRUE(key.verifies(with.digest, with.padding, message, made));
      }
    }
  }
}

TEST_F(DigestSignatureTest, TheTaVerifiesWhatLibcryptoSigns) {
  for (const unsigned bits : {1024U, 2048U}) {
    const rsa_test_key& key = rsa_test_key::of_bits(bits);
    const bytes blob = import_fixed(bits);
    for (const scheme& with : schemes()) {
      if (with.padding == KM_PAD_RSA_PSS && bits == 1024 && with.digest == KM_DIGEST_SHA_2_512) continue;  // see below
      SCOPED_TRACE(fmt::format("{} bits, padding {}, digest {}", bits, with.padding, with.digest));
      const bytes message = pattern(321, bits);
      const bytes made = key.sign(with.digest, with.padding, message);
      const finish_answer good =
          succeeds([&] { return client().verify(blob, signature(with.digest, with.padding), message, made); });
      EXPECT_TRUE(good.data.empty());
    }
  }
}

TEST_F(DigestSignatureTest, Pkcs1SignaturesAreTheSameOnBothSides) {
  const bytes message = from_text("deterministic"), blob = import_fixed(1024);
  for (const scheme& with : schemes()) {
    if (with.padding != KM_PAD_RSA_PKCS1_1_5_SIGN) continue;
    EXPECT_EQ(client().sign(blob, signature(with.digest, with.padding), message).data,
              rsa_test_key::of_bits(1024).sign(with.digest, with.padding, message));
  }
}

TEST_F(DigestSignatureTest, ThePssSaltIsAsLongAsTheDigestWhereTwoOfThemFitAndElseTheLongest) {
  struct salt_case {
    unsigned bits;
    std::uint32_t digest;
    int salt;
  };
  for (const salt_case& each : {salt_case{2048, KM_DIGEST_SHA_2_512, 64},
                                {1024, KM_DIGEST_SHA1, 20},
                                {1024, KM_DIGEST_SHA_2_256, 32},
                                {1024, KM_DIGEST_SHA_2_384, 48},
                                {1024, KM_DIGEST_SHA_2_512, 62},  // 2 x 65 > 128
                                {688, KM_DIGEST_SHA_2_384, 36},   // 2 x 49 > 86
                                {688, KM_DIGEST_SHA_2_512, 20},
                                {512, KM_DIGEST_SHA_2_224, 28},     // 2 x 29 <= 64
                                {512, KM_DIGEST_SHA_2_256, 30}}) {  // 2 x 33 > 64
    SCOPED_TRACE(fmt::format("{} bits, digest {}", each.bits, each.digest));
    const rsa_test_key& key = rsa_test_key::of_bits(each.bits);
    const bytes message = from_text("salted"), blob = import_fixed(each.bits);
    const bytes made = client().sign(blob, signature(each.digest, KM_PAD_RSA_PSS), message).data;
    EXPECT_TRUE(key.verifies(each.digest, KM_PAD_RSA_PSS, message, made, each.salt));
    EXPECT_FALSE(key.verifies(each.digest, KM_PAD_RSA_PSS, message, made, each.salt - 1));
    EXPECT_TRUE(client().verify(blob, signature(each.digest, KM_PAD_RSA_PSS), message, made).ok());
  }
}

TEST_F(DigestSignatureTest, AnyPssSaltIsAcceptedWhenVerifying) {
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes message = from_text("salted"), blob = import_fixed(1024);
  for (const int salt : {0, 1, 20, 32, 94}) {
    const bytes made = key.sign(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS, message, salt);
    EXPECT_TRUE(client().verify(blob, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS), message, made).ok()) << salt;
  }
}

TEST_F(DigestSignatureTest, AWrongSignatureFailsVerification) {
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(1024), message = from_text("message");
  for (const scheme& with :
       {scheme{KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA_2_256}, {KM_PAD_RSA_PSS, KM_DIGEST_SHA1}}) {
    const bytes made = key.sign(with.digest, with.padding, message);
    expect_wrong(blob, with, from_text("massage"), made);
    for (const std::size_t offset : {0U, 64U, 127U}) expect_wrong(blob, with, message, flip(made, offset));
    expect_wrong(blob, with, message, {});
    expect_wrong(blob, with, message, bytes(made.begin(), made.end() - 1));
    expect_wrong(blob, with, message, join({made, {0}}));
    expect_wrong(blob, with, message, bytes(128, 0));
    expect_wrong(blob, with, message, bytes(128, 0xFF));
    expect_wrong(blob, with, message, pattern(5000));
  }
}

TEST_F(DigestSignatureTest, ASignatureOfAnotherSchemeFailsVerification) {
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(1024), message = from_text("message");
  const bytes made = key.sign(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message);
  expect_wrong(blob, {KM_PAD_RSA_PSS, KM_DIGEST_SHA_2_256}, message, made);
  expect_wrong(blob, {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA1}, message, made);
  expect_wrong(import_fixed(2048), {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA_2_256}, message, made);
}

TEST_F(DigestSignatureTest, AModulusWithALeadingZeroGivesSignaturesOneByteLonger) {
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  rsa_components padded = key.components();
  padded[rsa_n].insert(padded[rsa_n].begin(), 0);
  const bytes blob = client().must_import(rsa_key(0).remove(KM_TAG_KEY_SIZE), rsa_material(padded));
  const bytes message = from_text("message");
  for (const scheme& with :
       {scheme{KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA_2_256}, {KM_PAD_RSA_PSS, KM_DIGEST_SHA1}}) {
    const bytes made = client().sign(blob, signature(with.digest, with.padding), message).data;
    ASSERT_EQ(made.size(), 129U);
    EXPECT_EQ(made.front(), 0);
    EXPECT_TRUE(key.verifies(with.digest, with.padding, message, {made.begin() + 1, made.end()}));
    EXPECT_TRUE(client().verify(blob, signature(with.digest, with.padding), message, made).ok());
  }
}

}  // namespace
}  // namespace testing_support
