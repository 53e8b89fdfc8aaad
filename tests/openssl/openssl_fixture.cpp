#include "tests/openssl/openssl_fixture.h"

#include "tests/support/rsa_test_key.h"

using namespace keymaster;

namespace testing_support {

const std::vector<digest_name> all_digests = {
    {KM_DIGEST_MD5, "-md5", 16},          {KM_DIGEST_SHA1, "-sha1", 20},        {KM_DIGEST_SHA_2_224, "-sha224", 28},
    {KM_DIGEST_SHA_2_256, "-sha256", 32}, {KM_DIGEST_SHA_2_384, "-sha384", 48}, {KM_DIGEST_SHA_2_512, "-sha512", 64}};

bytes OpensslTest::blob_of(unsigned bits) {
  const auto known = blobs_.find(bits);
  if (known != blobs_.end()) return known->second;
  return blobs_[bits] = client().must_import(rsa_key(bits), rsa_test_key::of_bits(bits).material());
}

std::string OpensslTest::key_file(unsigned bits) {
  return std::filesystem::absolute("tests/data/rsa_" + std::to_string(bits) + ".pem").string();
}

bytes OpensslTest::sign_in_ta(const bytes& blob, std::uint32_t digest, std::uint32_t padding, const bytes& message) {
  const finish_answer made = client().sign(blob, signature(digest, padding), message);
  EXPECT_TRUE(made.ok()) << made.result << ", error " << made.error;
  return made.data;
}

bool OpensslTest::verifies_in_ta(const bytes& blob, std::uint32_t digest, std::uint32_t padding, const bytes& message,
                                 const bytes& given) {
  const finish_answer judged = client().verify(blob, signature(digest, padding), message, given);
  EXPECT_EQ(judged.result, TEEC_SUCCESS);
  EXPECT_TRUE(judged.error == KM_ERROR_OK || judged.error == KM_ERROR_VERIFICATION_FAILED) << judged.error;
  return judged.ok();
}

bytes OpensslTest::random_message(std::size_t most) {
  const std::size_t size = std::uniform_int_distribution<std::size_t>(0, most)(random_);
  return pattern(size, static_cast<std::uint32_t>(random_()));
}

}  // namespace testing_support
