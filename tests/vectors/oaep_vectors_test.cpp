// Published RSA-OAEP vectors through the whole command boundary: import, begin, updates cut at random places, finish.
// Every vector agrees with its verdict, or stands on the list of those that this system judges otherwise.
#include <fmt/format.h>

#include "tests/support/device_fixture.h"
#include "tests/support/encryption.h"
#include "tests/support/rsa_test_key.h"
#include "tests/vectors/vector_file.h"

using namespace keymaster;

namespace testing_support {
namespace {

class OaepVectorsTest : public DeviceTest {
 protected:
  /// check decrypts every case. A label can't be stated here, so that messages under one are refused as wrongly padded,
  /// valid or not.
  void check(const nlohmann::json& file, const std::string& digest_name, std::uint32_t digest) {
    int checked = 0;
    for (const auto& group : file.at("testGroups")) {
      ASSERT_EQ(group.at("sha").get<std::string>(), digest_name);
      ASSERT_EQ(group.at("mgfSha").get<std::string>(), "SHA-1");  // the mask's digest here, whatever the label's
      const bytes blob = import(group);
      for (const auto& test : group.at("tests")) {
        const bool labelled = !test.at("label").get<std::string>().empty();
        SCOPED_TRACE(fmt::format("case {}: {} {}", test.at("tcId").get<int>(), test.at("comment").get<std::string>(),
                                 test.at("flags").dump()));
        ++checked;
        check_case(blob, signature(digest, KM_PAD_RSA_OAEP), test, labelled);
      }
    }
    EXPECT_EQ(checked, file.at("numberOfTests").get<int>());
  }

 private:
  bytes import(const nlohmann::json& group) {
    param_list params = rsa_cipher_key(group.at("keySize").get<std::uint32_t>());
    return client().must_import(params.remove(KM_TAG_RSA_PUBLIC_EXPONENT), private_material(group));
  }

  void check_case(const bytes& blob, const param_list& params, const nlohmann::json& test, bool labelled) {
    const std::string result = test.at("result").get<std::string>();
    ASSERT_TRUE(result == "valid" || result == "invalid") << result;
    const bool accepted = result == "valid" && !labelled;
    const bytes ciphertext = from_hex(test.at("ct").get<std::string>());
    const hosted_tee::accounting before = tee.accounting();
    std::mt19937 random(test.at("tcId").get<std::uint32_t>());
    const cipher_answer back = run_cipher(client(), KM_PURPOSE_DECRYPT, blob, params, cut(ciphertext, random));
    expect_same(before);
    EXPECT_EQ(back.result, TEEC_SUCCESS);
    // A ciphertext longer than the modulus is refused as soon as it is too long.
    const bool too_long = ciphertext.size() > 256;
    EXPECT_EQ(back.error, accepted   ? KM_ERROR_OK
                          : too_long ? KM_ERROR_INVALID_INPUT_LENGTH
                                     : KM_ERROR_INVALID_ARGUMENT);
    if (!accepted) return;
    const bytes message = from_hex(test.at("msg").get<std::string>());
    EXPECT_EQ(to_hex(back.text), to_hex(message));
  }
};

TEST_F(OaepVectorsTest, Sha1AgreesWithThePublishedVectors) {
  const auto file = read_vectors("rsa_oaep_2048_sha1_mgf1sha1_test.json");
  if (!file) GTEST_SKIP() << no_vectors;
  check(*file, "SHA-1", KM_DIGEST_SHA1);
}

TEST_F(OaepVectorsTest, Sha256AgreesWithThePublishedVectors) {
  const auto file = read_vectors("rsa_oaep_2048_sha256_mgf1sha1_test.json");
  if (!file) GTEST_SKIP() << no_vectors;
  check(*file, "SHA-256", KM_DIGEST_SHA_2_256);
}

}  // namespace
}  // namespace testing_support
