// What the operations with RSA and ECDSA keys share.
#ifndef TEE_CRYPTO_PAIR_OPERATION_H_
#define TEE_CRYPTO_PAIR_OPERATION_H_

#include "tee/crypto/attributes.h"
#include "tee/crypto/operation.h"

namespace hosted_tee {

/// Works on a key pair or public key, in one call, so it has no progress to keep.
class pair_operation : public operation {
 public:
  using operation::operation;

 protected:
  [[nodiscard]] const evp_key& key() const { return key_; }
  /// A context of the key for one libcrypto operation, not yet initialised for it.
  [[nodiscard]] evp_key_context context() const;

 private:
  void take_key(const key_material& material) override {
    key_ = shared(material.key);
    take_details(material);
  }
  void drop_key() override { key_.reset(); }
  void copy_content(const operation& other) override {
    const auto& source = dynamic_cast<const pair_operation&>(other);
    key_ = shared(source.key_);
    copy_details(source);
  }
  virtual void take_details(const key_material& /*material*/) {}
  virtual void copy_details(const pair_operation& /*other*/) {}

  evp_key key_;
};

/// Signs digests and verifies their signatures.
class signature_operation : public pair_operation {
 public:
  using pair_operation::pair_operation;

  /// sign refuses with TEE_ERROR_BAD_PARAMETERS: a digest of a wrong length, a key that can't carry the signature.
  virtual void sign(const attribute_view& params, bytes_view digest, const output& signature) const = 0;
  /// verify refuses with TEE_ERROR_SIGNATURE_INVALID whatever isn't a signature of the digest under the key, and with
  /// TEE_ERROR_BAD_PARAMETERS a digest of a wrong length.
  virtual void verify(const attribute_view& params, bytes_view digest, bytes_view signature) const = 0;
};

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_PAIR_OPERATION_H_
