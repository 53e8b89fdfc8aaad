#include "client/lib/rsa_public_key.h"

#include <openssl/core_names.h>
#include <openssl/err.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <algorithm>
#include <array>
#include <stdexcept>

#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

constexpr std::string_view header = "-----BEGIN PUBLIC KEY-----\n";
constexpr std::string_view footer = "\n-----END PUBLIC KEY-----";
constexpr int smallest_key = 2048;

using md_ctx_ptr = std::unique_ptr<EVP_MD_CTX, openssl_free<EVP_MD_CTX_free>>;

/// The reason is told in the caller's words; libcrypto's own queue must not leak into a later call.
[[noreturn]] void refuse(const std::string& why) {
  ERR_clear_error();
  throw format_error(why);
}

bytes der_of(const EVP_PKEY* key) {
  unsigned char* raw = nullptr;
  const int length = i2d_PUBKEY(key, &raw);
  if (length <= 0) {
    refuse("the public key can't be encoded");
  }
  bytes der(raw, raw + length);
  OPENSSL_free(raw);
  return der;
}

std::string base64_of(byte_view data) {
  std::string text((data.size() + 2) / 3 * 4 + 1, '\0');  // libcrypto writes a NUL behind it
  const int length =
      EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data()), data.data(), static_cast<int>(data.size()));
  text.resize(static_cast<std::size_t>(length));
  return text;
}

/// The bytes of a base64 text, perhaps with some zeros more. Whether it is the one text of the key is seen later.
bytes from_base64(std::string_view text) {
  bytes data(text.size() / 4 * 3);
  const auto* const characters = reinterpret_cast<const unsigned char*>(text.data());
  const int length = EVP_DecodeBlock(data.data(), characters, static_cast<int>(text.size()));
  if (text.empty() || text.size() % 4 != 0 || length < 0) {
    refuse("what stands between the lines of the PEM is not base64");
  }
  return data;
}

bignum_ptr exponent_of(const EVP_PKEY* key) {
  BIGNUM* raw = nullptr;
  if (EVP_PKEY_get_bn_param(key, OSSL_PKEY_PARAM_RSA_E, &raw) != 1) {
    refuse("the key has no public exponent");
  }
  return bignum_ptr(raw);
}

struct digest_row {
  keymaster_digest_t digest;
  const EVP_MD* (*algorithm)();
};
constexpr std::array digest_rows = std::to_array<digest_row>({{KM_DIGEST_MD5, EVP_md5},
                                                              {KM_DIGEST_SHA1, EVP_sha1},
                                                              {KM_DIGEST_SHA_2_224, EVP_sha224},
                                                              {KM_DIGEST_SHA_2_256, EVP_sha256},
                                                              {KM_DIGEST_SHA_2_384, EVP_sha384},
                                                              {KM_DIGEST_SHA_2_512, EVP_sha512}});

const EVP_MD* algorithm_of(keymaster_digest_t digest) {
  const auto row = std::ranges::find(digest_rows, digest, &digest_row::digest);
  if (row == digest_rows.end()) {
    throw std::invalid_argument("statements are signed by their digest");
  }
  return row->algorithm();
}

/// A public key needs no passphrase; without this libcrypto would ask the terminal for one.
int no_passphrase(char* /*buffer*/, int /*size*/, int /*writing*/, void* /*context*/) {
  return -1;
}

bool is_pss(keymaster_padding_t padding) {
  if (padding != KM_PAD_RSA_PSS && padding != KM_PAD_RSA_PKCS1_1_5_SIGN) {
    throw std::invalid_argument("statements are signed with PKCS#1 v1.5 or PSS");
  }
  return padding == KM_PAD_RSA_PSS;
}

bool set_padding(EVP_PKEY_CTX* context, bool pss) {
  if (EVP_PKEY_CTX_set_rsa_padding(context, pss ? RSA_PKCS1_PSS_PADDING : RSA_PKCS1_PADDING) != 1) {
    return false;
  }
  return !pss || EVP_PKEY_CTX_set_rsa_pss_saltlen(context, RSA_PSS_SALTLEN_AUTO) == 1;
}

}  // namespace

rsa_public_key::rsa_public_key(pkey_ptr key) : key_(std::move(key)) {
  if (EVP_PKEY_is_a(key_.get(), "RSA") != 1) {
    refuse("the key is no RSA key");
  }
  if (const int bits = EVP_PKEY_get_bits(key_.get()); bits > OPENSSL_RSA_MAX_MODULUS_BITS) {
    refuse("the key has " + std::to_string(bits) + " bits, more than anybody verifies with");
  }
  if (const int bits = EVP_PKEY_get_bits(key_.get()); bits < smallest_key) {
    refuse("the key has " + std::to_string(bits) + " bits, and fewer than " + std::to_string(smallest_key) +
           " are too few");
  }
  const bignum_ptr exponent = exponent_of(key_.get());
  if (BN_is_odd(exponent.get()) != 1 || BN_is_one(exponent.get()) == 1) {
    refuse("the public exponent of the key is not an odd number above 2");
  }
}

rsa_public_key rsa_public_key::from_pem(std::string_view text) {
  const bio_ptr file(BIO_new_mem_buf(text.data(), static_cast<int>(std::min<std::size_t>(text.size(), INT32_MAX))));
  pkey_ptr key(file == nullptr ? nullptr : PEM_read_bio_PUBKEY(file.get(), nullptr, no_passphrase, nullptr));
  if (key == nullptr) {
    refuse("there is no public key in PEM");
  }
  return rsa_public_key(std::move(key));
}

rsa_public_key rsa_public_key::from_statement(std::string_view text) {
  if (text.size() < header.size() + footer.size() || !text.starts_with(header) || !text.ends_with(footer)) {
    refuse("the key does not stand between the lines of a PEM");
  }
  const std::string_view base64 = text.substr(header.size(), text.size() - header.size() - footer.size());
  const bytes decoded = from_base64(base64);
  const unsigned char* at = decoded.data();
  pkey_ptr key(d2i_PUBKEY(nullptr, &at, static_cast<long>(decoded.size())));
  if (key == nullptr) {
    refuse("the key is not a SubjectPublicKeyInfo");
  }
  if (base64_of(der_of(key.get())) != base64) {
    refuse("the key is not written in the one form that it has");
  }
  return rsa_public_key(std::move(key));
}

std::string rsa_public_key::pem() const {
  const bio_ptr out(BIO_new(BIO_s_mem()));
  if (out == nullptr || PEM_write_bio_PUBKEY(out.get(), key_.get()) != 1) {
    refuse("the public key can't be written as PEM");
  }
  const char* text = nullptr;
  const long length = BIO_get_mem_data(out.get(), &text);
  return {text, static_cast<std::size_t>(length)};
}

bytes rsa_public_key::der() const {
  return der_of(key_.get());
}

std::uint32_t rsa_public_key::bits() const {
  return static_cast<std::uint32_t>(EVP_PKEY_get_bits(key_.get()));
}

std::size_t rsa_public_key::signature_size() const {
  return static_cast<std::size_t>(EVP_PKEY_get_size(key_.get()));
}

bool rsa_public_key::verifies(byte_view message, byte_view signature, const signature_scheme& scheme) const {
  const EVP_MD* const digest = algorithm_of(scheme.digest);
  const bool pss = is_pss(scheme.padding);
  const md_ctx_ptr context(EVP_MD_CTX_new());
  EVP_PKEY_CTX* settings = nullptr;  // the context's
  const bool valid =
      context != nullptr && EVP_DigestVerifyInit(context.get(), &settings, digest, nullptr, key_.get()) == 1 &&
      set_padding(settings, pss) &&
      EVP_DigestVerify(context.get(), signature.data(), signature.size(), message.data(), message.size()) == 1;
  ERR_clear_error();
  return valid;
}

}  // namespace keymaster::client
