// Published ECDSA vectors through the whole command boundary: import, begin, updates cut at random places, finish.
// Every vector agrees with its verdict.
#include <fmt/format.h>

#include "tests/support/device_fixture.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/encryption.h"
#include "tests/vectors/vector_file.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// The vectors have public keys only. The TA's keys are pairs, of which verification uses the point alone, and nobody
/// checks that the two belong together: any private value does.
bytes public_point_material(const nlohmann::json& group) {
  const auto& key = group.at("publicKey");
  const bytes point = from_hex(key.at("uncompressed").get<std::string>());
  const auto middle = point.begin() + 1 + static_cast<std::ptrdiff_t>(point.size() / 2);
  const ec_fields fields = {
      key.at("keySize").get<std::uint32_t>(), {point.begin() + 1, middle}, {middle, point.end()}, {1}};
  return fields.material();
}

class EcdsaVectorsTest : public DeviceTest {
 protected:
  /// A signature either verifies or is refused as such; nothing is left behind in either case.
  void check_verdict(const bytes& blob, std::uint32_t digest, const vector_case& test) {
    SCOPED_TRACE(fmt::format("case {}: {} [{}]", test.id, test.comment, test.flags));
    const hosted_tee::accounting before = tee.accounting();
    const std::uint32_t operation = client().must_begin(KM_PURPOSE_VERIFY, blob, ec_digest(digest));
    std::mt19937 random(static_cast<std::uint32_t>(test.id));  // so that a failure comes back
    for (const bytes& piece : cut(test.message, random)) {
      const answer fed = client().update(operation, piece);
      ASSERT_TRUE(fed.ok() && fed.b == piece.size()) << "update: " << fed.result << ", error " << fed.error;
    }
    const finish_answer judged = client().finish(operation, test.signature);
    EXPECT_EQ(judged.result, TEEC_SUCCESS);
    EXPECT_EQ(judged.error, test.expected == verdict::invalid ? KM_ERROR_VERIFICATION_FAILED : KM_ERROR_OK);
    expect_same(before);
  }

  void check_file(const std::string& name, std::uint32_t bits, std::uint32_t digest) {
    const auto file = read_vectors(name);
    if (!file) GTEST_SKIP() << no_vectors;
    int checked = 0;
    for (const auto& group : file->at("testGroups")) {
      const bytes blob = client().must_import(ec_key(bits), public_point_material(group));
      for_each_case(group, [&](const vector_case& test) {
        check_verdict(blob, digest, test);
        ++checked;
      });
    }
    EXPECT_EQ(checked, file->at("numberOfTests").get<int>());
  }
};

TEST_F(EcdsaVectorsTest, SignaturesOnP256AreJudgedAsPublished) {
  check_file("ecdsa_secp256r1_sha256_test.json", 256, KM_DIGEST_SHA_2_256);
}

TEST_F(EcdsaVectorsTest, SignaturesOnP521AreJudgedAsPublished) {
  check_file("ecdsa_secp521r1_sha512_test.json", 521, KM_DIGEST_SHA_2_512);
}

}  // namespace
}  // namespace testing_support
