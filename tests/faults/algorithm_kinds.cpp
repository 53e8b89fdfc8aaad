#include "tests/faults/algorithm_kinds.h"

#include <gtest/gtest.h>

using namespace keymaster;

namespace testing_support {
namespace {

param_list free_key(std::uint32_t algorithm, std::uint32_t bits) {
  return param_list{}.add(KM_TAG_ALGORITHM, algorithm).add(KM_TAG_KEY_SIZE, bits).add(KM_TAG_NO_AUTH_REQUIRED, 1);
}

param_list rsa_cipher_key() {
  return rsa_key(1024)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
      .add(KM_TAG_PADDING, KM_PAD_RSA_OAEP)
      .add(KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_ENCRYPT);
}

std::uint32_t counterpart(std::uint32_t purpose) {
  return purpose == KM_PURPOSE_DECRYPT ? KM_PURPOSE_ENCRYPT : KM_PURPOSE_SIGN;
}

}  // namespace

param_list aes_kind_key(std::uint32_t block_mode, std::uint32_t padding) {
  return free_key(KM_ALGORITHM_AES, 128)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
      .add(KM_TAG_BLOCK_MODE, block_mode)
      .add(KM_TAG_PADDING, padding)
      .add(KM_TAG_CALLER_NONCE, 1)
      .add(KM_TAG_MIN_MAC_LENGTH, 96);
}

param_list aes_kind_operation(std::uint32_t block_mode, std::uint32_t padding, std::size_t nonce) {
  param_list params;
  params.add(KM_TAG_BLOCK_MODE, block_mode).add(KM_TAG_PADDING, padding).add(KM_TAG_MAC_LENGTH, 96);
  if (nonce != 0) params.add_blob(KM_TAG_NONCE, pattern(nonce));
  return params;
}

kind aes_kind(std::string name, std::uint32_t purpose, std::uint32_t block_mode, std::uint32_t padding,
              std::size_t nonce) {
  // Only a tag that the platform calls wrong keeps a decryption from ending well.
  const bool lenient = block_mode == KM_MODE_GCM && purpose == KM_PURPOSE_DECRYPT;
  return {std::move(name),
          aes_kind_key(block_mode, padding),
          pattern(16),
          purpose,
          aes_kind_operation(block_mode, padding, nonce),
          lenient};
}

kind with_aad(kind what) {
  what.name += "_with_aad";
  what.aad = pattern(20, 5);
  return what;
}

kind gcm_decrypt() {
  return aes_kind("aes_gcm_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_GCM, KM_PAD_NONE, 12);
}
kind gcm_encrypt() {
  return aes_kind("aes_gcm_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_GCM, KM_PAD_NONE, 0);
}
kind cbc_decrypt() {
  return aes_kind("aes_cbc_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_CBC, KM_PAD_PKCS7, 16);
}

param_list ec_kind_key() {
  return free_key(KM_ALGORITHM_EC, 256)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_DIGEST, KM_DIGEST_NONE)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
}

param_list hmac_kind_key() {
  return free_key(KM_ALGORITHM_HMAC, 256)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
      .add(KM_TAG_MIN_MAC_LENGTH, 64);
}

param_list hmac_kind_operation() {
  return param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_MAC_LENGTH, 128);
}

kind rsa_kind(std::string name, std::uint32_t purpose, std::uint32_t digest, std::uint32_t padding) {
  return {std::move(name), rsa_cipher_key(), rsa_test_key::of_bits(1024).material(), purpose,
          signature(digest, padding)};
}

kind ec_kind(std::string name, std::uint32_t purpose, std::uint32_t digest) {
  return {std::move(name), ec_kind_key(), {}, purpose, param_list{}.add(KM_TAG_DIGEST, digest)};
}
kind hmac_kind(std::string name, std::uint32_t purpose) {
  return {std::move(name), hmac_kind_key(), pattern(32), purpose, hmac_kind_operation()};
}

std::vector<kind> every_kind() {
  return {
      aes_kind("aes_ecb_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_ECB, KM_PAD_PKCS7, 0),
      aes_kind("aes_ecb_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_ECB, KM_PAD_PKCS7, 0),
      aes_kind("aes_ecb_unpadded_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_ECB, KM_PAD_NONE, 0),
      aes_kind("aes_cbc_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_CBC, KM_PAD_PKCS7, 16),
      cbc_decrypt(),
      aes_kind("aes_cbc_unpadded_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_CBC, KM_PAD_NONE, 16),
      aes_kind("aes_cbc_unpadded_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_CBC, KM_PAD_NONE, 16),
      aes_kind("aes_ctr_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_CTR, KM_PAD_NONE, 0),
      aes_kind("aes_ctr_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_CTR, KM_PAD_NONE, 16),
      gcm_encrypt(),
      gcm_decrypt(),
      with_aad(gcm_encrypt()),
      with_aad(gcm_decrypt()),
      ec_kind("ec_sign", KM_PURPOSE_SIGN, KM_DIGEST_SHA_2_256),
      ec_kind("ec_sign_without_digest", KM_PURPOSE_SIGN, KM_DIGEST_NONE),
      ec_kind("ec_verify", KM_PURPOSE_VERIFY, KM_DIGEST_SHA_2_256),
      ec_kind("ec_verify_without_digest", KM_PURPOSE_VERIFY, KM_DIGEST_NONE),
      hmac_kind("hmac_sign", KM_PURPOSE_SIGN),
      hmac_kind("hmac_verify", KM_PURPOSE_VERIFY),
      rsa_kind("rsa_oaep_encrypt", KM_PURPOSE_ENCRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP),
      rsa_kind("rsa_oaep_decrypt", KM_PURPOSE_DECRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP),
      rsa_kind("rsa_pkcs1_encrypt", KM_PURPOSE_ENCRYPT, KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT),
      rsa_kind("rsa_pkcs1_decrypt", KM_PURPOSE_DECRYPT, KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT),
      rsa_kind("rsa_raw_encrypt", KM_PURPOSE_ENCRYPT, KM_DIGEST_NONE, KM_PAD_NONE),
      rsa_kind("rsa_raw_decrypt", KM_PURPOSE_DECRYPT, KM_DIGEST_NONE, KM_PAD_NONE),
  };
}

void arrange(stage& on, const kind& what) {
  on.blob =
      what.material.empty() ? on.client().must_generate(what.key) : on.client().must_import(what.key, what.material);
  on.params = what.params;
  on.message = pattern(32);
  if (what.purpose != KM_PURPOSE_DECRYPT && what.purpose != KM_PURPOSE_VERIFY) return;
  const std::uint32_t handle = on.client().must_begin(counterpart(what.purpose), on.blob, on.params);
  const answer fed = on.client().update(handle, on.message, what.update_params());
  const finish_answer done = on.client().finish(handle);
  ASSERT_TRUE(fed.ok() && done.ok());
  if (what.purpose == KM_PURPOSE_VERIFY) {
    on.signature = done.data;
  } else {
    on.message = join({fed.body(), done.data});
  }
}

}  // namespace testing_support
