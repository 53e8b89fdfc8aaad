#include <openssl/core_names.h>
#include <openssl/params.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <algorithm>
#include <array>

#include "tee/crypto/magnitude.h"
#include "tee/crypto/rsa_operation.h"

namespace hosted_tee {

namespace {

/// disable_implicit_rejection: newer versions of libcrypto answer a wrong PKCS #1 v1.5 padding with made-up data; the
/// API's caller wants to be told.
bool disable_implicit_rejection(EVP_PKEY_CTX* context) {
  constexpr const char* name = "implicit-rejection";
  if (OSSL_PARAM_locate_const(EVP_PKEY_CTX_settable_params(context), name) == nullptr) return true;
  unsigned int off = 0;
  const std::array<OSSL_PARAM, 2> params = {OSSL_PARAM_construct_uint(name, &off), OSSL_PARAM_construct_end()};
  return EVP_PKEY_CTX_set_params(context, params.data()) == 1;
}

bool set_oaep(EVP_PKEY_CTX* context, const algorithm& kind, const attribute_view& params) {
  if (EVP_PKEY_CTX_set_rsa_oaep_md(context, fetched_digest(kind.digest)) != 1 ||
      EVP_PKEY_CTX_set_rsa_mgf1_md(context, fetched_digest(kind.mask)) != 1) {
    return false;
  }
  if (!params.has(TEE_ATTR_RSA_OAEP_LABEL)) return true;
  const bytes_view label = params.bytes(TEE_ATTR_RSA_OAEP_LABEL);
  if (label.empty()) return true;
  void* const copy = OPENSSL_memdup(label.data(), label.size());  // the context takes it over when it succeeds
  if (copy == nullptr) throw std::bad_alloc();
  if (EVP_PKEY_CTX_set0_rsa_oaep_label(context, copy, static_cast<int>(label.size())) == 1) return true;
  OPENSSL_free(copy);
  return false;
}

}  // namespace

std::optional<bytes_view> as_block(bytes_view bytes, std::size_t width, std::size_t max_width) {
  if (bytes.size() < width || bytes.size() > std::max(width, max_width)) return std::nullopt;
  const bytes_view surplus = bytes.first(bytes.size() - width);
  if (!significant(surplus).empty()) return std::nullopt;
  return bytes.last(width);
}

bool rsa_cipher_operation::is_bare() const {
  return kind().padding == RSA_NO_PADDING;
}

void rsa_cipher_operation::prepare(EVP_PKEY_CTX* context, const attribute_view& params) const {
  refuse_unless(EVP_PKEY_CTX_set_rsa_padding(context, kind().padding) == 1, TEE_ERROR_GENERIC);
  if (kind().padding == RSA_PKCS1_OAEP_PADDING) {
    refuse_unless(set_oaep(context, kind(), params), TEE_ERROR_GENERIC);
  }
}

secret_bytes rsa_cipher_operation::bare_block(bytes_view number) const {
  // A number from the modulus on, but no longer than it, is left to libcrypto to refuse.
  const bytes_view value = significant(number);
  refuse_unless(value.size() <= modulus_.size(), TEE_ERROR_BAD_PARAMETERS);
  return right_aligned(value, modulus_.size());
}

void rsa_cipher_operation::encrypt(const attribute_view& params, bytes_view plain, const output& destination) const {
  expect_mode(TEE_MODE_ENCRYPT);
  expect_key();
  secret_bytes result(modulus_.size());
  if (!is_bare()) (void)destination.room(result.size());
  const secret_bytes block = is_bare() ? bare_block(plain) : secret_bytes();
  const bytes_view source = is_bare() ? bytes_view(block) : plain;

  const evp_key_context libcrypto = context();
  refuse_unless(EVP_PKEY_encrypt_init(libcrypto.get()) == 1, TEE_ERROR_GENERIC);
  prepare(libcrypto.get(), params);
  std::size_t written = result.size();
  refuse_unless(EVP_PKEY_encrypt(libcrypto.get(), result.data(), &written, pointer_to(source), source.size()) == 1 &&
                    written == result.size(),
                TEE_ERROR_BAD_PARAMETERS);
  destination.put(is_bare() ? significant(result) : bytes_view(result));
}

void rsa_cipher_operation::decrypt(const attribute_view& params, bytes_view cipher, const output& destination) const {
  expect_mode(TEE_MODE_DECRYPT);
  expect_key();
  secret_bytes block;
  if (is_bare()) {
    block = bare_block(cipher);
  } else {
    const auto whole = as_block(cipher, modulus_.size(), max_bits() / 8);
    refuse_unless(whole.has_value(), TEE_ERROR_BAD_PARAMETERS);
    block.assign(whole->begin(), whole->end());
  }

  const evp_key_context libcrypto = context();
  refuse_unless(EVP_PKEY_decrypt_init(libcrypto.get()) == 1, TEE_ERROR_GENERIC);
  prepare(libcrypto.get(), params);
  refuse_unless(kind().padding != RSA_PKCS1_PADDING || disable_implicit_rejection(libcrypto.get()), TEE_ERROR_GENERIC);
  secret_bytes result(modulus_.size());
  std::size_t written = result.size();
  refuse_unless(EVP_PKEY_decrypt(libcrypto.get(), result.data(), &written, block.data(), block.size()) == 1 &&
                    written <= result.size(),
                TEE_ERROR_BAD_PARAMETERS);
  const bytes_view plain = bytes_view(result).first(written);
  destination.put(is_bare() ? significant(plain) : plain);
}

void rsa_cipher_operation::export_spki(const output& destination) const {
  expect_mode(TEE_MODE_EXPORT);
  expect_key();
  unsigned char* encoded = nullptr;
  const int size = i2d_PUBKEY(key().get(), &encoded);
  refuse_unless(size > 0, TEE_ERROR_GENERIC);
  const struct release {
    unsigned char* encoded;
    ~release() { OPENSSL_free(encoded); }
  } on_return{encoded};
  destination.put({encoded, static_cast<std::size_t>(size)});
}

}  // namespace hosted_tee
