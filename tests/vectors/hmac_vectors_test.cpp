// Published HMAC vectors through the whole command boundary: import, begin, updates cut at random places, finish. Each
// MAC is made and checked. Keys of sizes that a digest doesn't allow are refused at import.
#include <fmt/format.h>

#include "tests/support/device_fixture.h"
#include "tests/support/encryption.h"
#include "tests/support/hmac_test_key.h"
#include "tests/vectors/vector_file.h"

using namespace keymaster;

namespace testing_support {
namespace {

class HmacVectorsTest : public DeviceTest {
 protected:
  finish_answer run(std::uint32_t purpose, const bytes& blob, std::uint32_t bits, const bytes& message,
                    std::mt19937& random, const bytes& mac) {
    const std::uint32_t operation = client().must_begin(purpose, blob, hmac_length(bits));
    for (const bytes& piece : cut(message, random)) {
      const answer fed = client().update(operation, piece);
      EXPECT_TRUE(fed.ok() && fed.b == piece.size()) << "update: " << fed.result << ", error " << fed.error;
    }
    return client().finish(operation, mac);
  }

  void check_case(const nlohmann::json& test, const bytes& blob, std::uint32_t bits) {
    const bytes message = from_hex(test.at("msg").get<std::string>());
    const bytes mac = from_hex(test.at("tag").get<std::string>());
    const bool valid = test.at("result").get<std::string>() == "valid";
    std::mt19937 random(test.at("tcId").get<std::uint32_t>());  // so that a failure comes back
    const hosted_tee::accounting before = tee.accounting();

    const finish_answer made = run(KM_PURPOSE_SIGN, blob, bits, message, random, {});
    EXPECT_TRUE(made.ok()) << made.result << ", error " << made.error;
    EXPECT_EQ(made.data == mac, valid);
    const finish_answer checked = run(KM_PURPOSE_VERIFY, blob, bits, message, random, mac);
    EXPECT_EQ(checked.result, TEEC_SUCCESS);
    EXPECT_EQ(checked.error, valid ? KM_ERROR_OK : KM_ERROR_VERIFICATION_FAILED);
    expect_same(before);
  }

  void check_file(const std::string& name, const hmac_limits& limits, int expected_refusals) {
    const auto file = read_vectors(name);
    if (!file) GTEST_SKIP() << no_vectors;
    int checked = 0, refused = 0;
    for (const auto& group : file->at("testGroups")) {
      const auto key_bits = group.at("keySize").get<std::uint32_t>(), bits = group.at("tagSize").get<std::uint32_t>();
      const param_list params = hmac_key(limits.digest, key_bits);
      for (const auto& test : group.at("tests")) {
        SCOPED_TRACE(fmt::format("case {}: {}", test.at("tcId").get<int>(), test.at("comment").get<std::string>()));
        const bytes key = from_hex(test.at("key").get<std::string>());
        ++checked;
        if (key_bits < limits.shortest_key || key_bits > limits.longest_key) {
          EXPECT_EQ(client().import_key(params, key).error, KM_ERROR_UNSUPPORTED_KEY_SIZE);
          ++refused;
          continue;
        }
        check_case(test, client().must_import(params, key), bits);
      }
    }
    EXPECT_EQ(checked, file->at("numberOfTests").get<int>());
    EXPECT_EQ(refused, expected_refusals);
  }
};

TEST_F(HmacVectorsTest, Sha1MacsAreMadeAndJudgedAsPublished) {
  check_file("hmac_sha1_test.json", every_hmac[1], 6);  // keys of 520 bits, where 512 are the most
}

TEST_F(HmacVectorsTest, Sha256MacsAreMadeAndJudgedAsPublished) {
  check_file("hmac_sha256_test.json", every_hmac[3], 6);  // keys of 128 bits, where 192 are the least
}

TEST_F(HmacVectorsTest, Sha512MacsAreMadeAndJudgedAsPublished) {
  check_file("hmac_sha512_test.json", every_hmac[5], 0);
}

}  // namespace
}  // namespace testing_support
