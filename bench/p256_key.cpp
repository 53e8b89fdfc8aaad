#include "bench/p256_key.h"

#include <openssl/core_names.h>
#include <openssl/crypto.h>
#include <openssl/ec.h>

#include <algorithm>
#include <array>

#include "src/params/keymaster_defs.h"

using namespace keymaster;

namespace bench {
namespace {

constexpr std::size_t field = 32;

}  // namespace

p256_parts make_p256_parts() {
  const key_owner key(EVP_EC_gen("P-256"));
  expect(key != nullptr);
  p256_parts parts{bytes(1 + 2 * field), bytes(field)};
  std::size_t length = 0;
  BIGNUM* d = nullptr;
  expect(EVP_PKEY_get_octet_string_param(key.get(), OSSL_PKEY_PARAM_PUB_KEY, parts.point.data(), parts.point.size(),
                                         &length) == 1 &&
         length == parts.point.size() && EVP_PKEY_get_bn_param(key.get(), OSSL_PKEY_PARAM_PRIV_KEY, &d) == 1);
  BN_bn2binpad(d, parts.d.data(), static_cast<int>(field));
  BN_free(d);
  return parts;
}

bytes p256_material(const p256_parts& parts) {
  const auto x = parts.point.begin() + 1, y = x + field;
  bytes material;
  append_u32(material, 256);
  append_block(material, {x, y});
  append_block(material, {y, y + field});
  append_block(material, parts.d);
  return material;
}

bytes p256_key_params() {
  return key_params(KM_ALGORITHM_EC, 256, {{KM_TAG_PURPOSE, KM_PURPOSE_SIGN}, {KM_TAG_DIGEST, KM_DIGEST_SHA_2_256}});
}

bytes p256_sign_params() {
  return marshal({{KM_TAG_DIGEST, KM_DIGEST_SHA_2_256}});
}

libcrypto_p256_signer::libcrypto_p256_signer(p256_parts parts, bytes message)
    : parts_(std::move(parts)),
      message_(std::move(message)),
      d_(field),
      sha256_(EVP_MD_fetch(nullptr, "SHA2-256", nullptr)) {
  expect(sha256_ != nullptr);
}

key_owner libcrypto_p256_signer::make_key() {
  std::reverse_copy(parts_.d.begin(), parts_.d.end(), d_.begin());  // libcrypto takes numbers in the processor's order
  char group[] = "P-256";
  const std::array<OSSL_PARAM, 4> params = {
      OSSL_PARAM_construct_utf8_string(OSSL_PKEY_PARAM_GROUP_NAME, group, 0),
      OSSL_PARAM_construct_octet_string(OSSL_PKEY_PARAM_PUB_KEY, parts_.point.data(), parts_.point.size()),
      OSSL_PARAM_construct_BN(OSSL_PKEY_PARAM_PRIV_KEY, d_.data(), d_.size()), OSSL_PARAM_construct_end()};
  const key_context_owner context(EVP_PKEY_CTX_new_from_name(nullptr, "EC", nullptr));
  EVP_PKEY* key = nullptr;
  expect(EVP_PKEY_fromdata_init(context.get()) == 1 &&
         EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_KEYPAIR, const_cast<OSSL_PARAM*>(params.data())) == 1);
  return key_owner(key);
}

bytes libcrypto_p256_signer::digest_message() {
  bytes digest(32);
  const digest_context_owner context(EVP_MD_CTX_new());
  expect(EVP_DigestInit_ex2(context.get(), sha256_.get(), nullptr) == 1 &&
         EVP_DigestUpdate(context.get(), message_.data(), message_.size()) == 1 &&
         EVP_DigestFinal_ex(context.get(), digest.data(), nullptr) == 1);
  return digest;
}

const bytes& libcrypto_p256_signer::sign() {
  const key_owner key = make_key();
  const bytes digest = digest_message();
  const key_context_owner context(EVP_PKEY_CTX_new_from_pkey(nullptr, key.get(), nullptr));
  signature_.resize(80);
  std::size_t length = signature_.size();
  expect(EVP_PKEY_sign_init(context.get()) == 1 &&
         EVP_PKEY_sign(context.get(), signature_.data(), &length, digest.data(), digest.size()) == 1);
  signature_.resize(length);
  OPENSSL_cleanse(d_.data(), d_.size());
  return signature_;
}

bool libcrypto_p256_signer::verifies(const bytes& signature) {
  const key_owner key = make_key();
  const bytes digest = digest_message();
  const key_context_owner context(EVP_PKEY_CTX_new_from_pkey(nullptr, key.get(), nullptr));
  expect(EVP_PKEY_verify_init(context.get()) == 1);
  return EVP_PKEY_verify(context.get(), signature.data(), signature.size(), digest.data(), digest.size()) == 1;
}

}  // namespace bench
