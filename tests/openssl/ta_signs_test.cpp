// Signatures that the TA makes, judged by the `openssl` command.
#include "tests/openssl/openssl_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class TaSignsTest : public OpensslTest {
 protected:
  void SetUp() override {
    for (const unsigned bits : {1024U, 2048U}) {
      ASSERT_EQ(run({"pkey", "-in", key_file(bits), "-pubout", "-out", public_key(bits)}).status, 0);
    }
  }
  static std::string public_key(unsigned bits) { return "public_" + std::to_string(bits) + ".pem"; }

  /// Whether openssl takes the signature for the message, with these options.
  bool openssl_accepts(unsigned bits, const std::string& digest, const std::vector<std::string>& options,
                       const bytes& message, const bytes& given) {
    write_file(file("message"), message);
    write_file(file("signature"), given);
    std::vector<std::string> arguments = {"dgst", digest, "-verify", public_key(bits)};
    arguments.insert(arguments.end(), options.begin(), options.end());
    arguments.insert(arguments.end(), {"-signature", "signature", "message"});
    return run(arguments).status == 0;
  }

  void expect_accepted_unless_altered(unsigned bits, const digest_name& digest, std::uint32_t padding,
                                      const std::vector<std::string>& options) {
    SCOPED_TRACE(digest.option + " with " + std::to_string(bits) + " bits");
    const bytes message = random_message(5000);
    const bytes made = sign_in_ta(blob_of(bits), digest.digest, padding, message);
    EXPECT_EQ(made.size(), bits / 8);
    EXPECT_TRUE(openssl_accepts(bits, digest.option, options, message, made));
    EXPECT_FALSE(openssl_accepts(bits, digest.option, options, message, flip(made, made.size() / 2)));
    EXPECT_FALSE(openssl_accepts(bits, digest.option, options, join({message, {0}}), made));
  }
};

TEST_F(TaSignsTest, Pkcs1SignaturesWithEveryDigestVerify) {
  for (const digest_name& digest : all_digests) {
    expect_accepted_unless_altered(2048, digest, KM_PAD_RSA_PKCS1_1_5_SIGN, {});
  }
}

TEST_F(TaSignsTest, PssSignaturesHaveASaltAsLongAsTheDigest) {
  for (const digest_name& digest : all_digests) {
    if (digest.digest == KM_DIGEST_MD5) continue;  // PSS is not defined with it
    expect_accepted_unless_altered(
        2048, digest, KM_PAD_RSA_PSS,
        {"-sigopt", "rsa_padding_mode:pss", "-sigopt", "rsa_pss_saltlen:" + std::to_string(digest.size)});
  }
}

TEST_F(TaSignsTest, APssSaltThatWouldNotFitIsAsLongAsTheKeyAllows) {
  // 128 bytes less the digest's 64, the trailer and a flag bit's byte leave 62.
  expect_accepted_unless_altered(1024, all_digests.back(), KM_PAD_RSA_PSS,
                                 {"-sigopt", "rsa_padding_mode:pss", "-sigopt", "rsa_pss_saltlen:62"});
}

TEST_F(TaSignsTest, APkcs1SignatureWithoutADigestRecoversToTheMessageItself) {
  const bytes blob = blob_of(2048);
  for (int round = 0; round < 8; ++round) {
    const bytes message = round == 0 ? bytes{} : round == 1 ? pattern(245) : random_message(245);
    SCOPED_TRACE(message.size());
    write_file(file("signature"), sign_in_ta(blob, KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN, message));
    const openssl_result recovered = run({"pkeyutl", "-verifyrecover", "-pubin", "-inkey", public_key(2048), "-in",
                                          "signature", "-pkeyopt", "rsa_padding_mode:pkcs1"});
    EXPECT_EQ(recovered.status, 0);
    EXPECT_EQ(from_text(recovered.output), message);
  }
}

TEST_F(TaSignsTest, ABareSignatureRecoversToTheMessageBehindZeros) {
  const bytes blob = blob_of(2048);
  for (int round = 0; round < 8; ++round) {
    // A whole block must be a number below the modulus, so it starts with a zero.
    bytes message = round == 0 ? join({{0}, pattern(255)}) : random_message(255);
    SCOPED_TRACE(message.size());
    write_file(file("signature"), sign_in_ta(blob, KM_DIGEST_NONE, KM_PAD_NONE, message));
    const openssl_result recovered = run({"pkeyutl", "-verifyrecover", "-pubin", "-inkey", public_key(2048), "-in",
                                          "signature", "-pkeyopt", "rsa_padding_mode:none"});
    EXPECT_EQ(recovered.status, 0);
    EXPECT_EQ(to_hex(from_text(recovered.output)), to_hex(join({bytes(256 - message.size()), message})));
  }
}

}  // namespace
}  // namespace testing_support
