// RSA: bare, encryption schemes and signatures.
#ifndef TEE_CRYPTO_RSA_OPERATION_H_
#define TEE_CRYPTO_RSA_OPERATION_H_

#include <optional>

#include "tee/crypto/pair_operation.h"

namespace hosted_tee {

/// RSAES-PKCS1-v1_5, RSAES-OAEP and the bare operation.
///
/// The bare operation is one on numbers: leading zero bytes of its input don't matter, and its result has none.
/// Everything else that goes in or comes out is as long as the modulus. What can't be encrypted or decrypted is refused
/// with TEE_ERROR_BAD_PARAMETERS, the same code for every reason.
class rsa_cipher_operation : public pair_operation {
 public:
  using pair_operation::pair_operation;

  void encrypt(const attribute_view& params, bytes_view plain, const output& destination) const;
  void decrypt(const attribute_view& params, bytes_view cipher, const output& destination) const;
  /// export_spki puts out the public key as a DER SubjectPublicKeyInfo; only in mode TEE_MODE_EXPORT.
  void export_spki(const output& destination) const;

 private:
  void take_details(const key_material& material) override { modulus_ = material.find(TEE_ATTR_RSA_MODULUS)->bytes; }
  void copy_details(const pair_operation& other) override {
    modulus_ = dynamic_cast<const rsa_cipher_operation&>(other).modulus_;
  }
  [[nodiscard]] bool is_bare() const;
  void prepare(EVP_PKEY_CTX* context, const attribute_view& params) const;
  [[nodiscard]] secret_bytes bare_block(bytes_view number) const;

  secret_bytes modulus_;
};

/// RSASSA-PKCS1-v1_5 and RSASSA-PSS (MGF1 with the same digest) over a digest that was made before.
///
/// PSS's salt is as long as TEE_ATTR_RSA_PSS_SALT_LENGTH says; -1 and none: as the digest; -2: the longest that fits
/// when signing, any when verifying.
class rsa_signature_operation : public signature_operation {
 public:
  using signature_operation::signature_operation;

  void sign(const attribute_view& params, bytes_view digest, const output& signature) const override;
  void verify(const attribute_view& params, bytes_view digest, bytes_view signature) const override;

 private:
  void prepare(EVP_PKEY_CTX* context, const attribute_view& params, int longest_salt) const;
};

/// as_block gives `bytes` in the `width` bytes of a modulus. A block that is longer only by zero bytes in front is
/// taken up to `max_width` bytes: so long are those of a key whose stated size counts a leading zero byte of its
/// modulus. Nothing: any other length.
[[nodiscard]] std::optional<bytes_view> as_block(bytes_view bytes, std::size_t width, std::size_t max_width);

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_RSA_OPERATION_H_
