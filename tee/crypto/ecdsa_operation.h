// ECDSA on the NIST prime curves.
#ifndef TEE_CRYPTO_ECDSA_OPERATION_H_
#define TEE_CRYPTO_ECDSA_OPERATION_H_

#include "tee/crypto/pair_operation.h"

namespace hosted_tee {

/// A signature is r and s, each as long as the curve's field. A digest may have any length up to that one.
///
/// On P-521 a digest of 66 bytes is the integer to be signed itself: its top 7 bits are 0, else it is refused with
/// TEE_ERROR_BAD_PARAMETERS. The caller has taken the leftmost 521 bits already, so they are not taken again.
class ecdsa_operation : public signature_operation {
 public:
  using signature_operation::signature_operation;

  void sign(const attribute_view& params, bytes_view digest, const output& signature) const override;
  void verify(const attribute_view& params, bytes_view digest, bytes_view signature) const override;

 private:
  [[nodiscard]] std::size_t half_bytes() const { return (kind().exact_bits + 7) / 8; }
  [[nodiscard]] secret_bytes digest_for_libcrypto(bytes_view digest) const;
};

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_ECDSA_OPERATION_H_
