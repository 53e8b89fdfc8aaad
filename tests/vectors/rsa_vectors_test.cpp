// Published RSA signature vectors through the whole command boundary: import, begin, updates cut at random places,
// finish. Every vector agrees with its verdict, or stands on the list of those that this system judges otherwise.
#include <fmt/format.h>

#include <map>
#include <random>

#include "tests/support/device_fixture.h"
#include "tests/vectors/vector_file.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// Cases by number that this system judges otherwise than the file's verdict, each with its reason.
using exceptions = std::map<int, std::string>;

/// A DigestInfo is compared with the one form that is made when signing, with the NULL of its parameters.
const exceptions pkcs1_exceptions = {{8, "a DigestInfo without its NULL is another block, and refused"}};

/// When verifying the platform recovers the salt's length from the signature and takes any; these are sound in all
/// else.
const exceptions pss_exceptions = {{67, "salt of 0 bytes"},  {68, "salt of 1 byte"},   {69, "salt of 20 bytes"},
                                   {70, "salt of 31 bytes"}, {71, "salt of 33 bytes"}, {72, "salt of 222 bytes"}};

std::uint32_t digest_of(const nlohmann::json& group) {
  static const std::map<std::string, std::uint32_t> digests = {{"SHA-1", KM_DIGEST_SHA1},
                                                               {"SHA-224", KM_DIGEST_SHA_2_224},
                                                               {"SHA-256", KM_DIGEST_SHA_2_256},
                                                               {"SHA-384", KM_DIGEST_SHA_2_384},
                                                               {"SHA-512", KM_DIGEST_SHA_2_512}};
  return digests.at(group.at("sha").get<std::string>());
}

class RsaVectorsTest : public DeviceTest {
 protected:
  /// Takes key material in, for whatever purpose. The exponent is the material's own.
  bytes import(const nlohmann::json& group, const bytes& material) {
    param_list params = rsa_key(group.at("keySize").get<std::uint32_t>());
    params.remove(KM_TAG_RSA_PUBLIC_EXPONENT);
    return client().must_import(params, material);
  }

  /// Feeds the message in pieces; where they are cut depends on the case's number alone, so that a failure comes back.
  void feed(std::uint32_t operation, const vector_case& test) {
    std::mt19937 random(static_cast<std::uint32_t>(test.id));
    for (auto at = test.message.begin(); at != test.message.end();) {
      const auto left = static_cast<std::size_t>(test.message.end() - at);
      const auto size = static_cast<std::ptrdiff_t>(std::uniform_int_distribution<std::size_t>(0, left)(random));
      const answer fed = client().update(operation, bytes(at, at + size));
      ASSERT_TRUE(fed.ok()) << "update: " << fed.result << ", error " << fed.error;
      ASSERT_EQ(fed.b, static_cast<std::uint32_t>(size));
      at += size;
    }
  }

  finish_answer run(std::uint32_t purpose, const bytes& blob, const param_list& params, const vector_case& test,
                    const bytes& signature) {
    const std::uint32_t operation = client().must_begin(purpose, blob, params);
    feed(operation, test);
    return client().finish(operation, signature);
  }

  /// A signature either verifies or is refused as such; nothing is left behind in either case.
  void check_verdict(const bytes& blob, const param_list& params, const vector_case& test, const exceptions& known) {
    SCOPED_TRACE(fmt::format("case {}: {} [{}]", test.id, test.comment, test.flags));
    const hosted_tee::accounting before = tee.accounting();
    const finish_answer answered = run(KM_PURPOSE_VERIFY, blob, params, test, test.signature);
    const bool accepted = answered.error == KM_ERROR_OK;
    EXPECT_EQ(answered.result, TEEC_SUCCESS);
    EXPECT_TRUE(accepted || answered.error == KM_ERROR_VERIFICATION_FAILED) << answered.error;
    const bool listed = known.contains(test.id);
    EXPECT_EQ(accepted, (test.expected != verdict::invalid) != listed) << (listed ? known.at(test.id) : "");
    expect_same(before);
  }

  void check_verification(const nlohmann::json& file, std::uint32_t padding, const exceptions& known) {
    int checked = 0;
    for (const auto& group : file.at("testGroups")) {
      const bytes blob = import(group, public_material(group));
      const param_list params = signature(digest_of(group), padding);
      for_each_case(group, [&](const vector_case& test) {
        check_verdict(blob, params, test, known);
        ++checked;
      });
    }
    EXPECT_EQ(checked, file.at("numberOfTests").get<int>());
  }
};

TEST_F(RsaVectorsTest, Pkcs1SignaturesAreJudgedAsPublished) {
  const auto file = read_vectors("rsa_signature_2048_sha256_test.json");
  if (!file) GTEST_SKIP() << no_vectors;
  check_verification(*file, KM_PAD_RSA_PKCS1_1_5_SIGN, pkcs1_exceptions);
}

TEST_F(RsaVectorsTest, PssSignaturesAreJudgedAsPublished) {
  const auto file = read_vectors("rsa_pss_2048_sha256_mgf1_32_test.json");
  if (!file) GTEST_SKIP() << no_vectors;
  check_verification(*file, KM_PAD_RSA_PSS, pss_exceptions);
}

TEST_F(RsaVectorsTest, Pkcs1SignaturesAreMadeAsPublished) {
  const auto file = read_vectors("rsa_pkcs1_2048_sig_gen_test.json");
  if (!file) GTEST_SKIP() << no_vectors;
  int checked = 0;
  for (const auto& group : file->at("testGroups")) {
    const bytes blob = import(group, private_material(group));
    const param_list params = signature(digest_of(group), KM_PAD_RSA_PKCS1_1_5_SIGN);
    for_each_case(group, [&](const vector_case& test) {
      SCOPED_TRACE(fmt::format("case {}: {} [{}]", test.id, test.comment, test.flags));
      const hosted_tee::accounting before = tee.accounting();
      const finish_answer signed_case = run(KM_PURPOSE_SIGN, blob, params, test, {});
      EXPECT_TRUE(signed_case.ok()) << signed_case.result << ", error " << signed_case.error;
      EXPECT_EQ(to_hex(signed_case.data), to_hex(test.signature));
      expect_same(before);
      ++checked;
    });
  }
  EXPECT_EQ(checked, file->at("numberOfTests").get<int>());
}

}  // namespace
}  // namespace testing_support
