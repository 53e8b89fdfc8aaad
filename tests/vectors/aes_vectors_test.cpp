// Published AES vectors through the whole command boundary: import, begin, updates cut at random places, finish. Every
// vector agrees with its verdict, or stands on the list of those that this system judges otherwise.
#include <fmt/format.h>

#include <map>
#include <set>

#include "tests/support/device_fixture.h"
#include "tests/support/encryption.h"
#include "tests/vectors/vector_file.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// GCM takes nonces of 96 bits and no others: of these lengths, in bits, every vector is refused at begin, which for
/// all but the empty ones is not the file's verdict.
const std::set<int> refused_nonces = {0, 8, 16, 32, 48, 64, 80, 120, 128, 160, 256, 512, 1024, 2056};

/// Cases of CBC that are accepted against the file's verdict, by their number among the cases of a key size.
constexpr int cbc_cases_of_a_key_size = 72;
const char* const no_padding = "a last byte of 0 says that no byte is padding, and the block is text";
const std::map<int, std::string> cbc_exceptions = {
    {25, "no data at all are a block of zeros, which is text like any other that ends in 0"},
    {26, no_padding},
    {27, no_padding},
    {28, no_padding},
    {29, no_padding},
    {30, no_padding},
    {31, no_padding},
    {38, no_padding},
    {39, no_padding},
    {41, no_padding},
    {42, no_padding},
    {43, no_padding}};

struct cipher_case {
  int id = 0;
  std::string told;
  bytes key, iv, aad, text, ciphertext;
  bool is_valid = false;
};

class AesVectorsTest : public DeviceTest {
 protected:
  static cipher_case read(const nlohmann::json& test) {
    const auto hex = [&](const char* name) {
      return test.contains(name) ? from_hex(test.at(name).get<std::string>()) : bytes{};
    };
    const std::string result = test.at("result").get<std::string>();
    if (result != "valid" && result != "invalid") throw std::runtime_error("unknown verdict: " + result);
    cipher_case read_case;
    read_case.id = test.at("tcId").get<int>();
    read_case.told =
        fmt::format("case {}: {} {}", read_case.id, test.at("comment").get<std::string>(), test.at("flags").dump());
    read_case.key = hex("key");
    read_case.iv = hex("iv");
    read_case.aad = hex("aad");
    read_case.text = hex("msg");
    read_case.ciphertext = join({hex("ct"), hex("tag")});
    read_case.is_valid = result == "valid";
    return read_case;
  }

  /// Runs an operation over pieces that follow from the case's number, so that a failure comes back. Nothing is left
  /// behind.
  cipher_answer run(std::uint32_t purpose, const cipher_case& test, const param_list& params, const bytes& input) {
    const bytes blob = client().must_import(aes_key(static_cast<std::uint32_t>(test.key.size() * 8)), test.key);
    const hosted_tee::accounting before = tee.accounting();
    std::mt19937 random(static_cast<std::uint32_t>(test.id));
    cipher_answer done = run_cipher(client(), purpose, blob, params, cut(input, random), test.aad);
    expect_same(before);
    return done;
  }

  void check_encryption(const cipher_case& test, const param_list& params) {
    const cipher_answer made = run(KM_PURPOSE_ENCRYPT, test, params, test.text);
    EXPECT_TRUE(made.ok()) << made.result << ", error " << made.error;
    EXPECT_EQ(to_hex(made.text) == to_hex(test.ciphertext), test.is_valid) << to_hex(made.text);
  }
  /// What is accepted against its verdict is taken for text as it is, to its last byte.
  void check_decryption(const cipher_case& test, const param_list& params, bool accepted, std::int32_t error) {
    const cipher_answer back = run(KM_PURPOSE_DECRYPT, test, params, test.ciphertext);
    EXPECT_EQ(back.result, TEEC_SUCCESS);
    EXPECT_EQ(back.error, accepted ? KM_ERROR_OK : error);
    if (!accepted) return;
    if (test.is_valid) {
      EXPECT_EQ(to_hex(back.text), to_hex(test.text));
    } else if (test.ciphertext.empty()) {
      EXPECT_EQ(back.text, bytes(16));
    } else {
      EXPECT_EQ(to_hex(aes_encrypt({KM_MODE_CBC, KM_PAD_NONE, test.key, test.iv}, back.text)), to_hex(test.ciphertext));
    }
  }
};

TEST_F(AesVectorsTest, GcmAgreesWithThePublishedVectors) {
  const auto file = read_vectors("aes_gcm_test.json");
  if (!file) GTEST_SKIP() << no_vectors;
  int checked = 0;
  for (const auto& group : file->at("testGroups")) {
    const bool refused = refused_nonces.contains(group.at("ivSize").get<int>());
    for (const auto& json : group.at("tests")) {
      const cipher_case test = read(json);
      SCOPED_TRACE(test.told);
      ++checked;
      param_list params = cipher(KM_MODE_GCM).add_blob(KM_TAG_NONCE, test.iv);
      params.add(KM_TAG_MAC_LENGTH, group.at("tagSize").get<std::uint32_t>());
      if (refused) {
        for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}) {
          EXPECT_EQ(run(purpose, test, params, {}).error, KM_ERROR_INVALID_ARGUMENT);
        }
        continue;
      }
      check_encryption(test, params);
      check_decryption(test, params, test.is_valid, KM_ERROR_VERIFICATION_FAILED);
    }
  }
  EXPECT_EQ(checked, file->at("numberOfTests").get<int>());
}

TEST_F(AesVectorsTest, CbcWithPkcs7AgreesWithThePublishedVectors) {
  const auto file = read_vectors("aes_cbc_pkcs5_test.json");
  if (!file) GTEST_SKIP() << no_vectors;
  int checked = 0;
  for (const auto& group : file->at("testGroups")) {
    for (const auto& json : group.at("tests")) {
      const cipher_case test = read(json);
      SCOPED_TRACE(test.told);
      ++checked;
      const param_list params = cipher(KM_MODE_CBC, KM_PAD_PKCS7, test.iv);
      if (test.is_valid) check_encryption(test, params);
      const auto listed = cbc_exceptions.find((test.id - 1) % cbc_cases_of_a_key_size + 1);
      const bool is_listed = listed != cbc_exceptions.end();
      SCOPED_TRACE(is_listed ? listed->second : "");
      check_decryption(test, params, test.is_valid != is_listed, KM_ERROR_INVALID_ARGUMENT);
    }
  }
  EXPECT_EQ(checked, file->at("numberOfTests").get<int>());
}

}  // namespace
}  // namespace testing_support
