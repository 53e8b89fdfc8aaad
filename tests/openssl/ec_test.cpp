// EC signatures between the TA and the `openssl` command, both ways, on every curve and with every digest.
#include "tests/openssl/openssl_fixture.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class OpensslEcTest : public OpensslTest {
 protected:
  static std::string ec_key_file(std::uint32_t bits) {
    return std::filesystem::absolute("tests/data/ec_" + std::to_string(bits) + ".pem").string();
  }
  bytes ec_blob_of(std::uint32_t bits) {
    return client().must_import(ec_key(bits), ec_test_key::of_bits(bits).material());
  }
  /// The public key of a size, in a file.
  std::string public_key(std::uint32_t bits) {
    const std::string name = "public_" + std::to_string(bits) + ".pem";
    EXPECT_EQ(run({"pkey", "-in", ec_key_file(bits), "-pubout", "-out", name}).status, 0);
    return name;
  }

  bool openssl_accepts(const std::string& public_file, const std::string& digest, const bytes& message,
                       const bytes& given) {
    write_file(file("message"), message);
    write_file(file("signature"), given);
    return run({"dgst", digest, "-verify", public_file, "-signature", "signature", "message"}).status == 0;
  }
  bool openssl_accepts_bare(const std::string& public_file, const bytes& digest, const bytes& given) {
    write_file(file("digest"), digest);
    write_file(file("signature"), given);
    return run({"pkeyutl", "-verify", "-pubin", "-inkey", public_file, "-in", "digest", "-sigfile", "signature"})
               .status == 0;
  }

  bool ta_accepts(const bytes& blob, std::uint32_t digest, const bytes& message, const bytes& given) {
    const finish_answer judged = client().verify(blob, ec_digest(digest), message, given);
    EXPECT_EQ(judged.result, TEEC_SUCCESS);
    EXPECT_TRUE(judged.error == KM_ERROR_OK || judged.error == KM_ERROR_VERIFICATION_FAILED) << judged.error;
    return judged.ok();
  }
};

/// The digests that ECDSA takes here: all but MD5.
bool is_taken(const digest_name& digest) {
  return digest.digest != KM_DIGEST_MD5;
}

TEST_F(OpensslEcTest, OpensslVerifiesWhatTheTaSigns) {
  for (const std::uint32_t bits : ec_sizes) {
    const std::string theirs = public_key(bits);
    const bytes blob = ec_blob_of(bits);
    for (const digest_name& digest : all_digests) {
      if (!is_taken(digest)) continue;
      SCOPED_TRACE(digest.option + " with " + std::to_string(bits) + " bits");
      const bytes message = random_message(5000);
      const finish_answer made = client().sign(blob, ec_digest(digest.digest), message);
      ASSERT_TRUE(made.ok());
      EXPECT_TRUE(openssl_accepts(theirs, digest.option, message, made.data));
      EXPECT_FALSE(openssl_accepts(theirs, digest.option, join({message, {0}}), made.data));
    }
  }
}

TEST_F(OpensslEcTest, TheTaVerifiesWhatOpensslSigns) {
  for (const std::uint32_t bits : ec_sizes) {
    const bytes blob = ec_blob_of(bits);
    for (const digest_name& digest : all_digests) {
      if (!is_taken(digest)) continue;
      SCOPED_TRACE(digest.option + " with " + std::to_string(bits) + " bits");
      const bytes message = random_message(5000);
      write_file(file("message"), message);
      ASSERT_EQ(run({"dgst", digest.option, "-sign", ec_key_file(bits), "-out", "signature", "message"}).status, 0);
      const bytes made = read_file(file("signature"));
      EXPECT_TRUE(ta_accepts(blob, digest.digest, message, made));
      EXPECT_FALSE(ta_accepts(blob, digest.digest, message, flip(made, made.size() - 1)));
      EXPECT_FALSE(ta_accepts(blob, digest.digest, join({message, {0}}), made));
    }
  }
}

TEST_F(OpensslEcTest, ADigestOfTheClientsIsSignedAndVerifiedBothWays) {
  for (const std::uint32_t bits : ec_sizes) {
    const std::string theirs = public_key(bits);
    const bytes blob = ec_blob_of(bits);
    for (const std::size_t size : {20U, 24U, 28U, 32U, 48U, 64U}) {  // pkeyutl takes what a digest can be
      if (size > (bits + 7) / 8) continue;
      SCOPED_TRACE(std::to_string(bits) + " bits, " + std::to_string(size) + " bytes");
      const bytes digest = pattern(size, bits);
      const finish_answer made = client().sign(blob, ec_digest(KM_DIGEST_NONE), digest);
      ASSERT_TRUE(made.ok());
      EXPECT_TRUE(openssl_accepts_bare(theirs, digest, made.data));
      EXPECT_FALSE(openssl_accepts_bare(theirs, flip(digest, 0), made.data));

      write_file(file("digest"), digest);
      ASSERT_EQ(run({"pkeyutl", "-sign", "-inkey", ec_key_file(bits), "-in", "digest", "-out", "signature"}).status, 0);
      EXPECT_TRUE(ta_accepts(blob, KM_DIGEST_NONE, digest, read_file(file("signature"))));
      EXPECT_FALSE(ta_accepts(blob, KM_DIGEST_NONE, flip(digest, 0), read_file(file("signature"))));
    }
  }
}

TEST_F(OpensslEcTest, AGeneratedKeySignsForItsExport) {
  for (const std::uint32_t bits : ec_sizes) {
    SCOPED_TRACE(bits);
    const bytes blob = client().must_generate(ec_key(bits)), message = random_message(3000);
    const ec_fields exported = ec_fields::parse(client().export_key(blob).body(), false);
    write_file(file("point.der"), ec_test_key::from_fields(exported).spki());
    ASSERT_EQ(run({"pkey", "-pubin", "-inform", "DER", "-in", "point.der", "-pubcheck", "-out", "point.pem"}).status,
              0);
    const finish_answer made = client().sign(blob, ec_digest(KM_DIGEST_SHA_2_256), message);
    ASSERT_TRUE(made.ok());
    EXPECT_TRUE(openssl_accepts("point.pem", "-sha256", message, made.data));
  }
}

}  // namespace
}  // namespace testing_support
