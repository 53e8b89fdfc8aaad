// Signatures that the `openssl` command makes, judged by the TA.
#include "tests/openssl/openssl_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class OpensslSignsTest : public OpensslTest {
 protected:
  bytes sign_with_openssl(unsigned bits, const std::string& digest, const std::vector<std::string>& options,
                          const bytes& message) {
    write_file(file("message"), message);
    std::vector<std::string> arguments = {"dgst", digest, "-sign", key_file(bits), "-out", "signature"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    arguments.emplace_back("message");
    EXPECT_EQ(run(arguments).status, 0);
    return read_file(file("signature"));
  }

  /// Without a digest: the message is what is padded. rsautl, since pkeyutl takes nothing longer than a digest.
  bytes sign_bare_with_openssl(const std::string& padding, const bytes& message) {
    write_file(file("message"), message);
    EXPECT_EQ(run({"rsautl", "-sign", padding, "-inkey", key_file(2048), "-in", "message", "-out", "signature"}).status,
              0);
    return read_file(file("signature"));
  }

  void expect_accepted_unless_altered(unsigned bits, std::uint32_t digest, std::uint32_t padding, const bytes& message,
                                      const bytes& made) {
    const bytes blob = blob_of(bits);
    EXPECT_TRUE(verifies_in_ta(blob, digest, padding, message, made));
    EXPECT_FALSE(verifies_in_ta(blob, digest, padding, message, flip(made, made.size() - 1)));
    if (!message.empty()) {
      EXPECT_FALSE(verifies_in_ta(blob, digest, padding, flip(message, message.size() / 2), made));
    }
  }
};

TEST_F(OpensslSignsTest, Pkcs1SignaturesWithEveryDigestVerify) {
  for (const digest_name& digest : all_digests) {
    SCOPED_TRACE(digest.option);
    const bytes message = random_message(5000);
    expect_accepted_unless_altered(2048, digest.digest, KM_PAD_RSA_PKCS1_1_5_SIGN, message,
                                   sign_with_openssl(2048, digest.option, {}, message));
  }
}

TEST_F(OpensslSignsTest, PssSignaturesVerifyWhateverTheirSalt) {
  for (const digest_name& digest : all_digests) {
    if (digest.digest == KM_DIGEST_MD5) continue;  // PSS is not defined with it
    for (const char* const salt : {"0", "8", "20", "digest", "max"}) {
      SCOPED_TRACE(digest.option + " with a salt of " + salt);
      const bytes message = random_message(5000);
      const bytes made = sign_with_openssl(
          2048, digest.option, {"-sigopt", "rsa_padding_mode:pss", "-sigopt", std::string("rsa_pss_saltlen:") + salt},
          message);
      expect_accepted_unless_altered(2048, digest.digest, KM_PAD_RSA_PSS, message, made);
    }
  }
}

TEST_F(OpensslSignsTest, APkcs1SignatureIsNoPssSignature) {
  const bytes message = random_message(100), made = sign_with_openssl(2048, "-sha256", {}, message);
  EXPECT_FALSE(verifies_in_ta(blob_of(2048), KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS, message, made));
}

TEST_F(OpensslSignsTest, APkcs1SignatureWithoutADigestVerifies) {
  for (int round = 0; round < 6; ++round) {
    const bytes message = round == 0 ? pattern(1) : round == 1 ? pattern(245) : random_message(245);
    SCOPED_TRACE(message.size());
    expect_accepted_unless_altered(2048, KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN, message,
                                   sign_bare_with_openssl("-pkcs", message));
  }
}

TEST_F(OpensslSignsTest, ABareSignatureOfAWholeBlockVerifies) {
  for (std::uint32_t seed = 1; seed < 6; ++seed) {
    SCOPED_TRACE(seed);
    bytes message = join({{0}, pattern(255, seed)});
    message[1] |= 1;  // one zero in front and no more: a second one would be lost with it
    expect_accepted_unless_altered(2048, KM_DIGEST_NONE, KM_PAD_NONE, message, sign_bare_with_openssl("-raw", message));
  }
}

}  // namespace
}  // namespace testing_support
