#include "tests/commands/sealed_blob.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <memory>
#include <stdexcept>

namespace testing_support {
namespace {

constexpr std::size_t nonce_offset = 1, nonce_size = 64, iv_offset = 65, iv_size = 12, tag_offset = 77, tag_size = 16;

using cipher_context = std::unique_ptr<EVP_CIPHER_CTX, decltype(&EVP_CIPHER_CTX_free)>;

void must(bool done) {
  if (!done) throw std::runtime_error("libcrypto refuses to seal");
}

}  // namespace

bytes blob_key(const bytes& ksk, const bytes& blob) {
  bytes key(32);
  unsigned length = 0;
  must(HMAC(EVP_sha256(), ksk.data(), static_cast<int>(ksk.size()), &blob.at(nonce_offset), nonce_size, key.data(),
            &length) != nullptr &&
       length == key.size());
  return key;
}

std::optional<bytes> open_blob(const bytes& ksk, const bytes& blob) {
  const bytes key = blob_key(ksk, blob);
  const cipher_context context(EVP_CIPHER_CTX_new(), EVP_CIPHER_CTX_free);
  bytes plaintext(blob.size() - blob_header), tag(blob.begin() + tag_offset, blob.begin() + tag_offset + tag_size);
  int length = 0;
  must(EVP_DecryptInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, key.data(), &blob.at(iv_offset)) == 1);
  must(EVP_DecryptUpdate(context.get(), plaintext.data(), &length, blob.data() + blob_header,
                         static_cast<int>(plaintext.size())) == 1);
  must(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_SET_TAG, tag_size, tag.data()) == 1);
  if (EVP_DecryptFinal_ex(context.get(), plaintext.data() + length, &length) != 1) return std::nullopt;
  return plaintext;
}

bytes seal_blob(const bytes& ksk, std::uint8_t protection, const bytes& plaintext) {
  bytes blob = join({{protection}, pattern(nonce_size, 3), pattern(iv_size, 4), bytes(tag_size)});
  const bytes key = blob_key(ksk, blob);
  const cipher_context context(EVP_CIPHER_CTX_new(), EVP_CIPHER_CTX_free);
  bytes ciphertext(plaintext.size() + 1);
  int length = 0;
  must(EVP_EncryptInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, key.data(), &blob.at(iv_offset)) == 1);
  must(EVP_EncryptUpdate(context.get(), ciphertext.data(), &length, plaintext.data(),
                         static_cast<int>(plaintext.size())) == 1);
  must(EVP_EncryptFinal_ex(context.get(), ciphertext.data() + length, &length) == 1);
  must(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_GET_TAG, tag_size, &blob.at(tag_offset)) == 1);
  ciphertext.pop_back();
  return join({blob, ciphertext});
}

bytes blob_plaintext(const bytes& key_data, const bytes& characteristics) {
  return join({prefixed(key_data), prefixed(characteristics)});
}

}  // namespace testing_support
