#include <openssl/rsa.h>

#include <limits>

#include "tee/crypto/rsa_operation.h"

namespace hosted_tee {

namespace {

constexpr std::uint32_t salt_as_digest = 0xFFFFFFFF;
constexpr std::uint32_t salt_longest = 0xFFFFFFFE;

int salt_length(const attribute_view& params, int longest_salt) {
  const TEE_Attribute* const given = params.find(TEE_ATTR_RSA_PSS_SALT_LENGTH);
  const std::uint32_t length = given == nullptr ? salt_as_digest : given->content.value.a;
  if (length == salt_as_digest) return RSA_PSS_SALTLEN_DIGEST;
  if (length == salt_longest) return longest_salt;
  refuse_unless(length <= static_cast<std::uint32_t>(std::numeric_limits<int>::max()), TEE_ERROR_BAD_PARAMETERS);
  return static_cast<int>(length);
}

}  // namespace

void rsa_signature_operation::prepare(EVP_PKEY_CTX* context, const attribute_view& params, int longest_salt) const {
  refuse_unless(EVP_PKEY_CTX_set_rsa_padding(context, kind().padding) == 1 &&
                    EVP_PKEY_CTX_set_signature_md(context, fetched_digest(kind().digest)) == 1,
                TEE_ERROR_GENERIC);
  if (kind().padding != RSA_PKCS1_PSS_PADDING) return;
  refuse_unless(EVP_PKEY_CTX_set_rsa_pss_saltlen(context, salt_length(params, longest_salt)) == 1,
                TEE_ERROR_BAD_PARAMETERS);
}

void rsa_signature_operation::sign(const attribute_view& params, bytes_view digest, const output& signature) const {
  expect_mode(TEE_MODE_SIGN);
  expect_key();
  refuse_unless(digest.size() == digest_bytes(kind().digest), TEE_ERROR_BAD_PARAMETERS);
  const auto size = static_cast<std::size_t>(EVP_PKEY_get_size(key().get()));
  std::uint8_t* const place = signature.room(size);

  const evp_key_context libcrypto = context();
  refuse_unless(EVP_PKEY_sign_init(libcrypto.get()) == 1, TEE_ERROR_GENERIC);
  prepare(libcrypto.get(), params, RSA_PSS_SALTLEN_MAX);
  std::size_t written = size;
  refuse_unless(EVP_PKEY_sign(libcrypto.get(), place, &written, digest.data(), digest.size()) == 1 && written == size,
                TEE_ERROR_BAD_PARAMETERS);
  signature.written(written);
}

void rsa_signature_operation::verify(const attribute_view& params, bytes_view digest, bytes_view signature) const {
  expect_mode(TEE_MODE_VERIFY);
  expect_key();
  refuse_unless(digest.size() == digest_bytes(kind().digest), TEE_ERROR_BAD_PARAMETERS);
  const auto block = as_block(signature, static_cast<std::size_t>(EVP_PKEY_get_size(key().get())), max_bits() / 8);
  refuse_unless(block.has_value(), TEE_ERROR_SIGNATURE_INVALID);

  const evp_key_context libcrypto = context();
  refuse_unless(EVP_PKEY_verify_init(libcrypto.get()) == 1, TEE_ERROR_GENERIC);
  prepare(libcrypto.get(), params, RSA_PSS_SALTLEN_AUTO);
  refuse_unless(EVP_PKEY_verify(libcrypto.get(), block->data(), block->size(), digest.data(), digest.size()) == 1,
                TEE_ERROR_SIGNATURE_INVALID);
}

}  // namespace hosted_tee
