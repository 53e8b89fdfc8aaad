#include "bench/libcrypto_signer.h"

#include <openssl/core_names.h>
#include <openssl/crypto.h>
#include <openssl/rsa.h>

#include <algorithm>
#include <array>

namespace bench {
namespace {

// The blob: protection type, nonce, IV, tag, ciphertext of key data and characteristics.
constexpr std::size_t nonce_offset = 1, nonce_size = 64, iv_offset = 65, tag_offset = 77, tag_size = 16, header = 93;

constexpr std::array<const char*, 8> component_names = {
    OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,           OSSL_PKEY_PARAM_RSA_D,
    OSSL_PKEY_PARAM_RSA_FACTOR1,   OSSL_PKEY_PARAM_RSA_FACTOR2,     OSSL_PKEY_PARAM_RSA_EXPONENT1,
    OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};

}  // namespace

libcrypto_signer::libcrypto_signer(bytes ksk, bytes blob, bytes message)
    : ksk_(std::move(ksk)),
      blob_(std::move(blob)),
      message_(std::move(message)),
      blob_key_(32),
      plaintext_(blob_.size() - header),
      signature_(1024),
      hmac_(EVP_MAC_fetch(nullptr, "HMAC", nullptr)),
      aes_(EVP_CIPHER_fetch(nullptr, "AES-256-GCM", nullptr)),
      sha256_(EVP_MD_fetch(nullptr, "SHA2-256", nullptr)) {
  expect(hmac_ && aes_ && sha256_);
}

void libcrypto_signer::derive_key() {
  const mac_context_owner context(EVP_MAC_CTX_new(hmac_.get()));
  char digest[] = "SHA2-256";
  const std::array<OSSL_PARAM, 2> params = {OSSL_PARAM_construct_utf8_string(OSSL_MAC_PARAM_DIGEST, digest, 0),
                                            OSSL_PARAM_construct_end()};
  std::size_t length = 0;
  expect(EVP_MAC_init(context.get(), ksk_.data(), ksk_.size(), params.data()) == 1 &&
         EVP_MAC_update(context.get(), &blob_.at(nonce_offset), nonce_size) == 1 &&
         EVP_MAC_final(context.get(), blob_key_.data(), &length, blob_key_.size()) == 1);
}

void libcrypto_signer::open_blob() {
  const cipher_context_owner context(EVP_CIPHER_CTX_new());
  int length = 0;
  expect(EVP_DecryptInit_ex2(context.get(), aes_.get(), blob_key_.data(), &blob_.at(iv_offset), nullptr) == 1 &&
         EVP_DecryptUpdate(context.get(), plaintext_.data(), &length, &blob_.at(header),
                           static_cast<int>(plaintext_.size())) == 1 &&
         EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_AEAD_SET_TAG, tag_size, &blob_.at(tag_offset)) == 1 &&
         EVP_DecryptFinal_ex(context.get(), plaintext_.data() + length, &length) == 1);
}

EVP_PKEY* libcrypto_signer::make_key() {
  // Behind the key data's length and the key's size: eight numbers, big-endian, each behind its length. libcrypto takes
  // them in the processor's order.
  numbers_.assign(plaintext_.begin(), plaintext_.end());
  std::array<OSSL_PARAM, component_names.size() + 1> params;
  std::size_t at = 8;
  for (std::size_t i = 0; i < component_names.size(); ++i) {
    const std::uint32_t length = u32_at(plaintext_, at);
    at += 4;
    std::uint8_t* const number = &numbers_.at(at);
    std::reverse(number, number + length);
    params.at(i) = OSSL_PARAM_construct_BN(component_names.at(i), number, length);
    at += length;
  }
  params.back() = OSSL_PARAM_construct_end();
  const key_context_owner context(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr));
  EVP_PKEY* key = nullptr;
  expect(EVP_PKEY_fromdata_init(context.get()) == 1 &&
         EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_KEYPAIR, params.data()) == 1);
  return key;
}

void libcrypto_signer::sign_message(EVP_PKEY* key) {
  const digest_context_owner context(EVP_MD_CTX_new());
  std::array<std::uint8_t, 32> digest;
  expect(EVP_DigestInit_ex2(context.get(), sha256_.get(), nullptr) == 1 &&
         EVP_DigestUpdate(context.get(), message_.data(), message_.size()) == 1 &&
         EVP_DigestFinal_ex(context.get(), digest.data(), nullptr) == 1);
  const key_context_owner signing(EVP_PKEY_CTX_new_from_pkey(nullptr, key, nullptr));
  signature_.resize(1024);
  std::size_t length = signature_.size();
  expect(EVP_PKEY_sign_init(signing.get()) == 1 &&
         EVP_PKEY_CTX_set_rsa_padding(signing.get(), RSA_PKCS1_PADDING) == 1 &&
         EVP_PKEY_CTX_set_signature_md(signing.get(), sha256_.get()) == 1 &&
         EVP_PKEY_sign(signing.get(), signature_.data(), &length, digest.data(), digest.size()) == 1);
  signature_.resize(length);
}

const bytes& libcrypto_signer::sign() {
  derive_key();
  open_blob();
  const key_owner key(make_key());
  sign_message(key.get());
  OPENSSL_cleanse(blob_key_.data(), blob_key_.size());
  OPENSSL_cleanse(plaintext_.data(), plaintext_.size());
  OPENSSL_cleanse(numbers_.data(), numbers_.size());
  return signature_;
}

}  // namespace bench
