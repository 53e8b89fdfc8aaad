// Exported public keys, as the `openssl` command reads them.
#include <gmock/gmock.h>

#include <algorithm>
#include <cctype>

#include "tests/openssl/openssl_fixture.h"
#include "tests/support/rsa_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// The hex digits of the modulus in the text form of a key, without the zero byte that shows it to be positive.
std::string modulus_in(const std::string& text) {
  const std::size_t start = text.find("Modulus:"), end = text.find("Exponent:");
  if (start == std::string::npos || end == std::string::npos) return "";
  std::string digits = text.substr(start + 8, end - start - 8);
  std::erase_if(digits, [](unsigned char c) { return std::isxdigit(c) == 0; });
  return digits.starts_with("00") ? digits.substr(2) : digits;
}

class OpensslExportTest : public OpensslTest {
 protected:
  openssl_result describe(const bytes& spki) {
    write_file(file("key.der"), spki);
    return run({"pkey", "-pubin", "-inform", "DER", "-in", "key.der", "-noout", "-text"});
  }
};

TEST_F(OpensslExportTest, AnImportedKeysExportIsByteForByteWhatOpensslMakesOfTheSameKey) {
  for (const unsigned bits : {512U, 680U, 688U, 1024U, 2048U}) {
    SCOPED_TRACE(bits);
    const answer exported = client().export_key(blob_of(bits));
    ASSERT_TRUE(exported.ok());
    ASSERT_EQ(run({"pkey", "-in", key_file(bits), "-pubout", "-outform", "DER", "-out", "expected.der"}).status, 0);
    EXPECT_EQ(to_hex(exported.body()), to_hex(read_file(file("expected.der"))));
  }
}

TEST_F(OpensslExportTest, AnExportReadsAsTheKeysSizeModulusAndExponent) {
  const answer exported = client().export_key(blob_of(2048));
  ASSERT_TRUE(exported.ok());
  const openssl_result text = describe(exported.body());
  ASSERT_EQ(text.status, 0);
  EXPECT_THAT(text.output, ::testing::HasSubstr("Public-Key: (2048 bit)"));
  EXPECT_THAT(text.output, ::testing::HasSubstr("Exponent: 65537 (0x10001)"));
  EXPECT_EQ(modulus_in(text.output), to_hex(rsa_test_key::of_bits(2048).component(rsa_n)));
}

TEST_F(OpensslExportTest, AGeneratedKeysExportHasTheSizeAndExponentThatWereAskedFor) {
  for (const std::uint64_t exponent : {3U, 17U, 65537U}) {
    SCOPED_TRACE(exponent);
    param_list params = rsa_key(1024);
    params.remove(KM_TAG_RSA_PUBLIC_EXPONENT).add(KM_TAG_RSA_PUBLIC_EXPONENT, exponent);
    const answer exported = client().export_key(client().must_generate(params));
    ASSERT_TRUE(exported.ok());
    const openssl_result text = describe(exported.body());
    ASSERT_EQ(text.status, 0);
    EXPECT_THAT(text.output, ::testing::HasSubstr("Public-Key: (1024 bit)"));
    EXPECT_THAT(text.output, ::testing::HasSubstr("Exponent: " + std::to_string(exponent) + " ("));
    EXPECT_EQ(modulus_in(text.output).size(), 1024U / 4);
  }
}

TEST_F(OpensslExportTest, AGeneratedKeySignsForItsExport) {
  const bytes blob = client().must_generate(rsa_key(2048)), message = random_message(3000);
  const answer exported = client().export_key(blob);
  ASSERT_TRUE(exported.ok());
  write_file(file("key.der"), exported.body());
  write_file(file("message"), message);
  write_file(file("signature"), sign_in_ta(blob, KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message));
  EXPECT_EQ(run({"pkey", "-pubin", "-inform", "DER", "-in", "key.der", "-out", "key.pem"}).status, 0);
  EXPECT_EQ(run({"dgst", "-sha256", "-verify", "key.pem", "-signature", "signature", "message"}).status, 0);
}

}  // namespace
}  // namespace testing_support
