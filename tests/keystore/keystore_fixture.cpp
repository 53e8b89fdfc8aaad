#include "tests/keystore/keystore_fixture.h"

#include <openssl/evp.h>

#include <cstring>
#include <stdexcept>

#include "platform/handles.h"

using namespace keymaster;

namespace testing_support {
namespace {

struct cipher_free {
  void operator()(EVP_CIPHER_CTX* context) const { EVP_CIPHER_CTX_free(context); }
};
using cipher_context = std::unique_ptr<EVP_CIPHER_CTX, cipher_free>;

void must(bool ok) {
  if (!ok) throw std::runtime_error("libcrypto refuses");
}

bytes part(const bytes& data, std::size_t offset, std::size_t size) {
  const auto first = data.begin() + static_cast<std::ptrdiff_t>(offset);
  return {first, first + static_cast<std::ptrdiff_t>(size)};
}

/// AES-256-GCM over `input`; `encrypt` tells the direction.
cipher_context start_gcm(const bytes& key, const bytes& iv, bool encrypt, const bytes& input, bytes& output) {
  cipher_context context(EVP_CIPHER_CTX_new());
  must(EVP_CipherInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, key.data(), iv.data(), encrypt ? 1 : 0) == 1);
  output.resize(input.size());
  int length = 0;
  must(EVP_CipherUpdate(context.get(), output.data(), &length, input.data(), static_cast<int>(input.size())) == 1);
  return context;
}

}  // namespace

bytes seal(std::uint8_t protection, const bytes& ksk, const bytes& nonce, const bytes& iv, const bytes& plaintext) {
  bytes ciphertext, tag(16);
  const cipher_context context = start_gcm(hmac_sha256(ksk, nonce), iv, true, plaintext, ciphertext);
  int length = 0;
  must(EVP_CipherFinal_ex(context.get(), nullptr, &length) == 1);
  must(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_AEAD_GET_TAG, 16, tag.data()) == 1);
  return join({bytes{protection}, nonce, iv, tag, ciphertext});
}

std::optional<bytes> unseal(const bytes& ksk, const bytes& blob) {
  bytes plaintext, tag = part(blob, 77, 16);
  const cipher_context context = start_gcm(hmac_sha256(ksk, part(blob, 1, 64)), part(blob, 65, 12), false,
                                           part(blob, 93, blob.size() - 93), plaintext);
  must(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_AEAD_SET_TAG, 16, tag.data()) == 1);
  int length = 0;
  if (EVP_CipherFinal_ex(context.get(), nullptr, &length) != 1) return std::nullopt;
  return plaintext;
}

void KeystoreTest::boot(bool rpmb) {
  ta_.reset();
  world_.reset();
  hosted_tee::world_options options;
  options.state = folder_.path() / "state";
  options.rpmb = rpmb;
  // All fields differ, so that a wrong byte order shows.
  options.device_id = TEE_UUID{0x01020304, 0x0506, 0x0708, {9, 10, 11, 12, 13, 14, 15, 16}};
  world_ = hosted_tee::secure_world::open(options);
  ta_.emplace(world_->device());
  spy = platform_spy();
}

void KeystoreTest::start_keys() {
  ASSERT_EQ(key_store_init(), TEE_SUCCESS);
  ta_->clear_trace();
  faults().clear();
  spy = platform_spy();
}

void KeystoreTest::reboot(bool rpmb) {
  key_store_release();
  boot(rpmb);
  start_keys();
}

void KeystoreTest::TearDown() {
  key_store_release();
  expect_same(ta_->holdings(), {});
}

std::optional<std::string> KeystoreTest::stored_ksk() {
  return world_->read_object(keymaster_ta, TEE_STORAGE_RPMB, ksk_id);
}

void KeystoreTest::store_ksk(const bytes& data) {
  world_->write_object(keymaster_ta, TEE_STORAGE_RPMB, ksk_id, std::string(data.begin(), data.end()));
}

bytes KeystoreTest::derived_value() const {
  const TEE_UUID id = world_->device_id();
  bytes value(32, 0x5A);
  std::memcpy(value.data(), &id, sizeof id);
  return value;
}

bytes KeystoreTest::rpmb_value() {
  const std::string value = stored_ksk().value_or("");
  return {value.begin(), value.end()};
}

bytes KeystoreTest::value_of(TEE_ObjectHandle key) {
  bytes value(64);
  std::uint32_t length = 64;
  EXPECT_EQ(TEE_GetObjectBufferAttribute(key, TEE_ATTR_SECRET_VALUE, value.data(), &length), TEE_SUCCESS);
  value.resize(length);
  return value;
}

saved KeystoreTest::save(const bytes& key_data, const param_list& characteristics, std::size_t capacity) {
  saved answer{0xDEADBEEF, 0xDEADBEEF, bytes(capacity, filler)};
  const auto before = ta_->holdings();
  {
    const parameter_set set = in_ta(characteristics);
    ta_->clear_trace();
    answer.result = save_key(key_data, set, answer.buffer, &answer.length);
  }
  expect_same(ta_->holdings(), before);
  return answer;
}

opened KeystoreTest::open(const bytes& blob) {
  opened answer{};
  answer.error = untouched;
  const auto before = ta_->holdings();
  {
    // What an earlier command left must be gone afterwards.
    secret_bytes key_data;
    EXPECT_TRUE(key_data.copy_of(pattern(9)));
    parameter_set characteristics = in_ta(param_list{}.add_blob(KM_TAG_NONCE, pattern(4)));
    ta_->clear_trace();
    answer.result = open_key(blob, key_data, characteristics, &answer.error);
    answer.key_data.assign(key_data.span().begin(), key_data.span().end());
    answer.characteristics = from_ta(characteristics);
    answer.has_key_data = static_cast<bool>(key_data) || key_data.size() != 0;
    answer.has_characteristics = characteristics.params != nullptr || characteristics.length != 0;
  }
  expect_same(ta_->holdings(), before);
  return answer;
}

bytes KeystoreTest::must_save(const bytes& key_data, const param_list& characteristics) {
  const saved answer = save(key_data, characteristics, 101 + key_data.size() + characteristics.marshal().size());
  EXPECT_EQ(answer.result, TEE_SUCCESS);
  return answer.blob();
}

void KeystoreTest::expect_not_saved(const saved& answer, TEE_Result result, const std::vector<std::string>& lines) {
  EXPECT_EQ(answer.result, result);
  EXPECT_EQ(answer.length, 0U);
  EXPECT_EQ(answer.buffer, bytes(answer.buffer.size(), filler));
  EXPECT_EQ(errors(), lines);
}

void KeystoreTest::expect_not_opened(const opened& answer, TEE_Result result, keymaster_error_t error,
                                     const std::vector<std::string>& lines) {
  EXPECT_EQ(answer.result, result);
  EXPECT_EQ(answer.error, error);
  EXPECT_FALSE(answer.has_key_data);
  EXPECT_FALSE(answer.has_characteristics);
  EXPECT_EQ(errors(), lines);
}

}  // namespace testing_support
