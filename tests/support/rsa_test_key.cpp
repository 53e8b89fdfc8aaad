#include "tests/support/rsa_test_key.h"

#include <fmt/format.h>
#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <map>
#include <stdexcept>

#include "src/params/keymaster_defs.h"

using namespace keymaster;

namespace testing_support {
namespace {

using key_context = std::unique_ptr<EVP_PKEY_CTX, decltype(&EVP_PKEY_CTX_free)>;
using digest_context = std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)>;

void must(bool done, const char* what) {
  if (!done) throw std::runtime_error(fmt::format("libcrypto refuses: {}", what));
}

EVP_PKEY* read_pem(unsigned bits) {
  const std::string name = fmt::format("tests/data/rsa_{}.pem", bits);
  const std::unique_ptr<BIO, decltype(&BIO_free)> file(BIO_new_file(name.c_str(), "r"), BIO_free);
  must(file != nullptr, name.c_str());
  EVP_PKEY* const key = PEM_read_bio_PrivateKey(file.get(), nullptr, nullptr, nullptr);
  must(key != nullptr, name.c_str());
  return key;
}

bytes number(EVP_PKEY* key, const char* name) {
  BIGNUM* value = nullptr;
  must(EVP_PKEY_get_bn_param(key, name, &value) == 1, name);
  bytes magnitude(static_cast<std::size_t>(BN_num_bytes(value)));
  BN_bn2bin(value, magnitude.data());
  BN_free(value);
  return magnitude;
}

const EVP_MD* digest_of(std::uint32_t digest) {
  static const std::map<std::uint32_t, const EVP_MD* (*)()> all = {
      {KM_DIGEST_MD5, EVP_md5},          {KM_DIGEST_SHA1, EVP_sha1},        {KM_DIGEST_SHA_2_224, EVP_sha224},
      {KM_DIGEST_SHA_2_256, EVP_sha256}, {KM_DIGEST_SHA_2_384, EVP_sha384}, {KM_DIGEST_SHA_2_512, EVP_sha512}};
  return all.at(digest)();
}

void choose_padding(EVP_PKEY_CTX* context, std::uint32_t padding, int salt) {
  const bool pss = padding == KM_PAD_RSA_PSS;
  must(EVP_PKEY_CTX_set_rsa_padding(context, pss ? RSA_PKCS1_PSS_PADDING : RSA_PKCS1_PADDING) == 1, "padding");
  if (pss) must(EVP_PKEY_CTX_set_rsa_pss_saltlen(context, salt) == 1, "salt length");
}

void choose_encryption(EVP_PKEY_CTX* context, std::uint32_t padding, std::uint32_t digest) {
  const bool oaep = padding == KM_PAD_RSA_OAEP;
  must(EVP_PKEY_CTX_set_rsa_padding(context, oaep ? RSA_PKCS1_OAEP_PADDING : RSA_PKCS1_PADDING) == 1, "padding");
  if (!oaep) return;
  must(EVP_PKEY_CTX_set_rsa_oaep_md(context, digest_of(digest)) == 1, "digest");
  must(EVP_PKEY_CTX_set_rsa_mgf1_md(context, EVP_sha1()) == 1, "mask");
}

using bare_function = int (*)(EVP_PKEY_CTX*, unsigned char*, std::size_t*, const unsigned char*, std::size_t);

bytes bare(EVP_PKEY* key, int (*init)(EVP_PKEY_CTX*), bare_function run, const bytes& block) {
  const key_context context(EVP_PKEY_CTX_new(key, nullptr), EVP_PKEY_CTX_free);
  must(init(context.get()) == 1 && EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_NO_PADDING) == 1, "bare operation");
  bytes result(block.size());
  std::size_t length = result.size();
  must(run(context.get(), result.data(), &length, block.data(), block.size()) == 1 && length == result.size(),
       "the block of a bare operation");
  return result;
}

}  // namespace

bytes rsa_material(const rsa_components& components) {
  bytes material;
  for (const bytes& component : components) material = join({material, prefixed(component)});
  return material;
}

rsa_test_key::rsa_test_key(unsigned bits) : key_(read_pem(bits), EVP_PKEY_free) {
  constexpr std::array<const char*, 8> names = {OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,
                                                OSSL_PKEY_PARAM_RSA_D,         OSSL_PKEY_PARAM_RSA_FACTOR1,
                                                OSSL_PKEY_PARAM_RSA_FACTOR2,   OSSL_PKEY_PARAM_RSA_EXPONENT1,
                                                OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};
  for (std::size_t i = 0; i < names.size(); ++i) components_.at(i) = number(key_.get(), names.at(i));
}

const rsa_test_key& rsa_test_key::of_bits(unsigned bits) {
  static std::map<unsigned, rsa_test_key> loaded;
  const auto found = loaded.find(bits);
  return found != loaded.end() ? found->second : loaded.emplace(bits, rsa_test_key(bits)).first->second;
}

bytes rsa_test_key::spki() const {
  unsigned char* der = nullptr;
  const int length = i2d_PUBKEY(key_.get(), &der);
  must(length > 0, "i2d_PUBKEY");
  bytes encoded(der, der + length);
  OPENSSL_free(der);
  return encoded;
}

bytes rsa_test_key::sign(std::uint32_t digest, std::uint32_t padding, const bytes& message, int salt) const {
  const digest_context context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  EVP_PKEY_CTX* rsa = nullptr;
  must(EVP_DigestSignInit(context.get(), &rsa, digest_of(digest), nullptr, key_.get()) == 1, "EVP_DigestSignInit");
  choose_padding(rsa, padding, salt);
  bytes signature(size());
  std::size_t length = signature.size();
  must(EVP_DigestSign(context.get(), signature.data(), &length, message.data(), message.size()) == 1, "signing");
  return signature;
}

bool rsa_test_key::verifies(std::uint32_t digest, std::uint32_t padding, const bytes& message, const bytes& signature,
                            int salt) const {
  const digest_context context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  EVP_PKEY_CTX* rsa = nullptr;
  must(EVP_DigestVerifyInit(context.get(), &rsa, digest_of(digest), nullptr, key_.get()) == 1, "EVP_DigestVerifyInit");
  choose_padding(rsa, padding, salt);
  return EVP_DigestVerify(context.get(), signature.data(), signature.size(), message.data(), message.size()) == 1;
}

bytes rsa_test_key::encrypt(std::uint32_t digest, std::uint32_t padding, const bytes& message) const {
  const key_context context(EVP_PKEY_CTX_new(key_.get(), nullptr), EVP_PKEY_CTX_free);
  must(EVP_PKEY_encrypt_init(context.get()) == 1, "EVP_PKEY_encrypt_init");
  choose_encryption(context.get(), padding, digest);
  bytes ciphertext(size());
  std::size_t length = ciphertext.size();
  const std::uint8_t nothing = 0;
  must(EVP_PKEY_encrypt(context.get(), ciphertext.data(), &length, message.empty() ? &nothing : message.data(),
                        message.size()) == 1,
       "encrypting");
  return ciphertext;
}

std::optional<bytes> rsa_test_key::decrypt(std::uint32_t digest, std::uint32_t padding, const bytes& ciphertext) const {
  const key_context context(EVP_PKEY_CTX_new(key_.get(), nullptr), EVP_PKEY_CTX_free);
  must(EVP_PKEY_decrypt_init(context.get()) == 1, "EVP_PKEY_decrypt_init");
  choose_encryption(context.get(), padding, digest);
  bytes message(size());
  std::size_t length = message.size();
  if (EVP_PKEY_decrypt(context.get(), message.data(), &length, ciphertext.data(), ciphertext.size()) != 1) {
    return std::nullopt;
  }
  message.resize(length);
  return message;
}

bytes rsa_test_key::private_operation(const bytes& block) const {
  return bare(key_.get(), EVP_PKEY_decrypt_init, EVP_PKEY_decrypt, block);
}

bytes rsa_test_key::public_operation(const bytes& block) const {
  return bare(key_.get(), EVP_PKEY_encrypt_init, EVP_PKEY_encrypt, block);
}

}  // namespace testing_support
