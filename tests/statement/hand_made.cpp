#include "tests/statement/hand_made.h"

#include <openssl/core_names.h>
#include <openssl/param_build.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <stdexcept>

namespace hand_made {
namespace {

void require(bool holds) {
  if (!holds) {
    throw std::runtime_error("libcrypto refuses what the test needs");
  }
}

std::string escape_slashes_and_line_ends(const std::string& text) {
  std::string out;
  for (const char character : text) {
    if (character == '/') {
      out += "\\/";
    } else if (character == '\n') {
      out += "\\n";
    } else {
      out += character;
    }
  }
  return out;
}

bytes sign(EVP_PKEY* key, std::string_view text, const EVP_MD* digest, int padding, int salt, const EVP_MD* mask) {
  const std::unique_ptr<EVP_MD_CTX, void (*)(EVP_MD_CTX*)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  EVP_PKEY_CTX* settings = nullptr;
  require(EVP_DigestSignInit(context.get(), &settings, digest, nullptr, key) == 1);
  require(EVP_PKEY_CTX_set_rsa_padding(settings, padding) == 1);
  if (padding == RSA_PKCS1_PSS_PADDING) {
    require(EVP_PKEY_CTX_set_rsa_pss_saltlen(settings, salt) == 1 &&
            EVP_PKEY_CTX_set_rsa_mgf1_md(settings, mask == nullptr ? digest : mask) == 1);
  }
  bytes signature(static_cast<std::size_t>(EVP_PKEY_get_size(key)));
  std::size_t length = signature.size();
  const auto* const message = reinterpret_cast<const unsigned char*>(text.data());
  require(EVP_DigestSign(context.get(), signature.data(), &length, message, text.size()) == 1);
  require(length == signature.size());
  return signature;
}

}  // namespace

key_ptr new_rsa_key(unsigned bits) {
  return {EVP_RSA_gen(bits), EVP_PKEY_free};
}

key_ptr new_rsa_pss_key() {
  const std::unique_ptr<EVP_PKEY_CTX, void (*)(EVP_PKEY_CTX*)> context(
      EVP_PKEY_CTX_new_from_name(nullptr, "RSA-PSS", nullptr), EVP_PKEY_CTX_free);
  EVP_PKEY* key = nullptr;
  require(EVP_PKEY_keygen_init(context.get()) == 1 && EVP_PKEY_keygen(context.get(), &key) == 1);
  return {key, EVP_PKEY_free};
}

EVP_PKEY* attestation_key() {
  static const key_ptr key = new_rsa_key(2048);
  return key.get();
}
EVP_PKEY* app_key() {
  static const key_ptr key = new_rsa_key(2048);
  return key.get();
}
EVP_PKEY* foreign_key() {
  static const key_ptr key = new_rsa_key(2048);
  return key.get();
}

key_ptr rsa_key_with(EVP_PKEY* modulus_of, unsigned exponent) {
  BIGNUM* n = nullptr;
  require(EVP_PKEY_get_bn_param(modulus_of, OSSL_PKEY_PARAM_RSA_N, &n) == 1);
  BIGNUM* const e = BN_new();
  require(BN_set_word(e, exponent) == 1);
  OSSL_PARAM_BLD* const builder = OSSL_PARAM_BLD_new();
  OSSL_PARAM_BLD_push_BN(builder, OSSL_PKEY_PARAM_RSA_N, n);
  OSSL_PARAM_BLD_push_BN(builder, OSSL_PKEY_PARAM_RSA_E, e);
  OSSL_PARAM* const params = OSSL_PARAM_BLD_to_param(builder);
  EVP_PKEY_CTX* const context = EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr);
  EVP_PKEY* key = nullptr;
  const bool made =
      EVP_PKEY_fromdata_init(context) == 1 && EVP_PKEY_fromdata(context, &key, EVP_PKEY_PUBLIC_KEY, params) == 1;
  EVP_PKEY_CTX_free(context);
  OSSL_PARAM_free(params);
  OSSL_PARAM_BLD_free(builder);
  BN_free(e);
  BN_free(n);
  require(made);
  return {key, EVP_PKEY_free};
}

std::string public_pem(EVP_PKEY* key) {
  const std::unique_ptr<BIO, void (*)(BIO*)> out(BIO_new(BIO_s_mem()), BIO_free_all);
  require(PEM_write_bio_PUBKEY(out.get(), key) == 1);
  char* text = nullptr;
  const long length = BIO_get_mem_data(out.get(), &text);
  return {text, static_cast<std::size_t>(length)};
}

std::string pem_around(const std::string& base64) {
  return "-----BEGIN PUBLIC KEY-----\n" + base64 + "\n-----END PUBLIC KEY-----";
}

std::string one_line_pem(EVP_PKEY* key) {
  std::string base64;
  const std::string pem = public_pem(key);
  const std::size_t first = pem.find('\n') + 1;
  for (const char character : pem.substr(first, pem.find("-----END") - first)) {
    if (character != '\n') {
      base64 += character;
    }
  }
  return pem_around(base64);
}

std::string one_line_member(EVP_PKEY* key) {
  return escape_slashes_and_line_ends(one_line_pem(key));
}

bytes sign_pkcs1(EVP_PKEY* key, std::string_view text, const EVP_MD* digest) {
  return sign(key, text, digest, RSA_PKCS1_PADDING, 0, nullptr);
}

bytes sign_pss(EVP_PKEY* key, std::string_view text, int salt, const EVP_MD* digest, const EVP_MD* mask) {
  return sign(key, text, digest, RSA_PKCS1_PSS_PADDING, salt, mask);
}

bytes pack(std::string_view text, const bytes& signature) {
  bytes statement;
  for (unsigned i = 0; i < 4; ++i) {
    statement.push_back(static_cast<std::uint8_t>(text.size() >> (8 * i)));
  }
  statement.insert(statement.end(), text.begin(), text.end());
  statement.insert(statement.end(), signature.begin(), signature.end());
  return statement;
}

bytes export_statement(std::string_view text, EVP_PKEY* key) {
  return pack(text, sign_pkcs1(key, text));
}

bytes sign_statement(std::string_view text, EVP_PKEY* key) {
  const std::string with_nul = std::string(text) + '\0';
  return pack(with_nul, sign_pkcs1(key, with_nul));
}

}  // namespace hand_made
