// RSA encryption between the TA and the `openssl` command, both ways.
#include "tests/openssl/openssl_fixture.h"
#include "tests/support/encryption.h"
#include "tests/support/rsa_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class OpensslRsaEncryptTest : public OpensslTest {
 protected:
  void SetUp() override {
    blob = client().must_import(rsa_cipher_key(2048), rsa_test_key::of_bits(2048).material());
    ASSERT_EQ(run({"pkey", "-in", key_file(2048), "-pubout", "-out", "public.pem"}).status, 0);
  }

  bytes encrypted_by_openssl(const std::vector<std::string>& options, const bytes& message) {
    return pkeyutl({"-encrypt", "-pubin", "-inkey", "public.pem"}, options, message);
  }
  bytes decrypted_by_openssl(const std::vector<std::string>& options, const bytes& ciphertext) {
    return pkeyutl({"-decrypt", "-inkey", key_file(2048)}, options, ciphertext);
  }
  bytes in_ta(std::uint32_t purpose, const param_list& params, const bytes& input) {
    const cipher_answer done = run_cipher(client(), purpose, blob, params, cut_every(input, 100));
    EXPECT_TRUE(done.ok()) << done.result << ", error " << done.error;
    return done.data;
  }

  void expect_both_ways(const param_list& params, const std::vector<std::string>& options, const bytes& message) {
    EXPECT_EQ(decrypted_by_openssl(options, in_ta(KM_PURPOSE_ENCRYPT, params, message)), message);
    EXPECT_EQ(in_ta(KM_PURPOSE_DECRYPT, params, encrypted_by_openssl(options, message)), message);
  }

  bytes blob;

 private:
  bytes pkeyutl(const std::vector<std::string>& what, const std::vector<std::string>& options, const bytes& input) {
    write_file(file("input"), input);
    std::vector<std::string> arguments = {"pkeyutl", "-in", "input", "-out", "output"};
    arguments.insert(arguments.end(), what.begin(), what.end());
    for (const std::string& option : options) arguments.insert(arguments.end(), {"-pkeyopt", option});
    EXPECT_EQ(run(arguments).status, 0);
    return read_file(file("output"));
  }
};

TEST_F(OpensslRsaEncryptTest, OaepWithEveryDigest) {
  for (const digest_name& digest : all_digests) {
    if (digest.digest == KM_DIGEST_MD5) continue;  // OAEP is not defined with it here
    SCOPED_TRACE(digest.option);
    const std::vector<std::string> options = {"rsa_padding_mode:oaep", "rsa_oaep_md:" + digest.option.substr(1),
                                              "rsa_mgf1_md:sha1"};
    const std::size_t most = 256 - 2 * digest.size - 2;
    for (const bytes& message : {pattern(1), pattern(most), random_message(most)}) {
      expect_both_ways(signature(digest.digest, KM_PAD_RSA_OAEP), options, message);
    }
  }
}

TEST_F(OpensslRsaEncryptTest, Pkcs1) {
  for (const bytes& message : {pattern(1), pattern(245), random_message(245), random_message(245)}) {
    expect_both_ways(signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT), {"rsa_padding_mode:pkcs1"}, message);
  }
}

TEST_F(OpensslRsaEncryptTest, BareBlocksWithAnyNumberOfLeadingZeros) {
  for (const std::size_t zeros : {1U, 2U, 17U, 255U}) {
    SCOPED_TRACE(zeros);
    expect_both_ways(signature(KM_DIGEST_NONE, KM_PAD_NONE), {"rsa_padding_mode:none"},
                     join({bytes(zeros), pattern(256 - zeros)}));
  }
}

TEST_F(OpensslRsaEncryptTest, AGeneratedKeysExportEncryptsForIt) {
  const bytes generated = client().must_generate(rsa_cipher_key(2048)), message = pattern(100);
  write_file(file("exported.der"), client().export_key(generated).body());
  ASSERT_EQ(run({"pkey", "-pubin", "-inform", "DER", "-in", "exported.der", "-out", "public.pem"}).status, 0);
  const bytes sealed =
      encrypted_by_openssl({"rsa_padding_mode:oaep", "rsa_oaep_md:sha256", "rsa_mgf1_md:sha1"}, message);
  blob = generated;
  EXPECT_EQ(in_ta(KM_PURPOSE_DECRYPT, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP), sealed), message);
}

}  // namespace
}  // namespace testing_support
