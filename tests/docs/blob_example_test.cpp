// The worked example of docs/blob-format.md: the blob that is printed there opens, and holds what is said there.
#include <gtest/gtest.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <array>
#include <fstream>
#include <memory>
#include <sstream>

#include "tests/support/device_fixture.h"

namespace {

using namespace testing_support;

// What the page says of its device: the identifier, and the key storage key that follows from it.
constexpr TEE_UUID device_id = {0x00112233, 0x4455, 0x6677, {0x88, 0x99, 0xaa, 0xbb, 0xcc, 0xdd, 0xee, 0xff}};
constexpr std::string_view storage_key = "33221100554477668899aabbccddeeff5a5a5a5a5a5a5a5a5a5a5a5a5a5a5a5a";

std::string page() {
  std::ifstream file("docs/blob-format.md");
  std::stringstream text;
  text << file.rdbuf();
  return text.str();
}

/// The hexadecimal digits of a fenced block: the first word of each of its lines.
bytes block(const std::string& text, const std::string& name) {
  const std::string fence = "```" + name + "\n";
  const std::size_t start = text.find(fence);
  if (start == std::string::npos) return {};
  std::istringstream lines(text.substr(start + fence.size(), text.find("```", start + 3) - start - fence.size()));
  std::string hex;
  for (std::string line; std::getline(lines, line);) hex += line.substr(0, line.find(' '));
  return from_hex(hex);
}

/// Opens a blob with libcrypto alone; empty when its tag does not verify.
bytes open_with_libcrypto(const bytes& blob) {
  const bytes ksk = from_hex(storage_key);
  std::array<std::uint8_t, 32> key{};
  unsigned length = 0;
  HMAC(EVP_sha256(), ksk.data(), static_cast<int>(ksk.size()), &blob[1], 64, key.data(), &length);

  const std::unique_ptr<EVP_CIPHER_CTX, decltype(&EVP_CIPHER_CTX_free)> gcm(EVP_CIPHER_CTX_new(), EVP_CIPHER_CTX_free);
  bytes tag(blob.begin() + 77, blob.begin() + 93);
  bytes plaintext(blob.size() - 93);
  int written = 0;
  const bool opened =
      EVP_DecryptInit_ex(gcm.get(), EVP_aes_256_gcm(), nullptr, key.data(), &blob[65]) == 1 &&
      EVP_DecryptUpdate(gcm.get(), plaintext.data(), &written, &blob[93], static_cast<int>(plaintext.size())) == 1 &&
      EVP_CIPHER_CTX_ctrl(gcm.get(), EVP_CTRL_AEAD_SET_TAG, 16, tag.data()) == 1 &&
      EVP_DecryptFinal_ex(gcm.get(), plaintext.data() + written, &written) == 1;
  return opened ? plaintext : bytes{};
}

class BlobExampleTest : public ::testing::Test {
 protected:
  void SetUp() override {
    hosted_tee::world_options options;
    options.state = folder.path() / "state";
    options.device_id = device_id;
    options.rpmb = false;
    world = hosted_tee::secure_world::open_shared(options);
    ASSERT_GT(blob.size(), 93U) << "the page has lost its blob";
  }

  const std::string text = page();
  const bytes blob = block(text, "blob");
  const bytes plaintext = block(text, "plaintext");
  const bytes app_id = from_text("my.app");
  temporary_folder folder;
  std::shared_ptr<hosted_tee::secure_world> world;
};

TEST_F(BlobExampleTest, OpensWithLibcryptoToThePlaintextOfThePage) {
  EXPECT_NE(text.find(storage_key), std::string::npos);
  EXPECT_EQ(to_hex(open_with_libcrypto(blob)), to_hex(plaintext));
}

TEST_F(BlobExampleTest, OpensInTheTaToTheCharacteristicsOfThePage) {
  ta_client client("embedded:" + (folder.path() / "state").string());
  const answer described = client.characteristics(blob, app_id);
  ASSERT_TRUE(described.ok()) << std::hex << described.result << " " << std::dec << described.error;
  const auto list = param_list::parse(described.body());
  ASSERT_TRUE(list.has_value());
  EXPECT_EQ(list->params().size(), 8U);  // nine on the page; the application id stays hidden
  EXPECT_FALSE(list->has(keymaster::KM_TAG_APPLICATION_ID));
  EXPECT_EQ(list->value(keymaster::KM_TAG_KEY_SIZE), 512U);
  EXPECT_EQ(list->value(keymaster::KM_TAG_ORIGIN), keymaster::KM_ORIGIN_IMPORTED);
}

TEST_F(BlobExampleTest, OpensForNoOtherApplication) {
  ta_client client("embedded:" + (folder.path() / "state").string());
  const answer refused = client.characteristics(blob, from_text("another.app"));
  EXPECT_EQ(refused.result, TEEC_SUCCESS);
  EXPECT_EQ(refused.error, keymaster::KM_ERROR_INVALID_KEY_BLOB);
  EXPECT_TRUE(world->trace().contains("Wrong AppId or AppData", hosted_tee::trace_level::error));
}

}  // namespace
