// Fixed RSA key pairs that libcrypto and the TA both know, so that each checks what the other made.
#ifndef TESTS_SUPPORT_RSA_TEST_KEY_H_
#define TESTS_SUPPORT_RSA_TEST_KEY_H_

#include <openssl/evp.h>

#include <array>
#include <memory>
#include <optional>

#include "tests/support/bytes.h"

namespace testing_support {

/// The components of a key pair in the order of the TA's import material.
enum rsa_component : std::size_t { rsa_n, rsa_e, rsa_d, rsa_p, rsa_q, rsa_dp, rsa_dq, rsa_qinv };
using rsa_components = std::array<bytes, 8>;

/// rsa_material joins the components, each behind its length.
bytes rsa_material(const rsa_components& components);

/// A key pair from tests/data, made with `openssl genpkey`, with libcrypto's own operations on it. Digests and paddings
/// are the public Keymaster values. What libcrypto refuses throws std::runtime_error.
class rsa_test_key {
 public:
  static constexpr int salt_as_digest = -1;
  static constexpr int salt_any = -2;  // when verifying

  /// of_bits answers the key of a size: 512, 680, 688, 1024, 2048, 3072 or 6144.
  static const rsa_test_key& of_bits(unsigned bits);

  [[nodiscard]] const rsa_components& components() const { return components_; }
  [[nodiscard]] const bytes& component(rsa_component which) const { return components_.at(which); }
  [[nodiscard]] bytes material() const { return rsa_material(components_); }
  [[nodiscard]] std::size_t size() const { return components_[rsa_n].size(); }  ///< of the modulus, in bytes

  /// spki is the public key as libcrypto encodes it: a DER SubjectPublicKeyInfo.
  [[nodiscard]] bytes spki() const;

  /// sign and verifies digest `message` with `digest` first. `salt` is PSS's salt length.
  [[nodiscard]] bytes sign(std::uint32_t digest, std::uint32_t padding, const bytes& message,
                           int salt = salt_as_digest) const;
  [[nodiscard]] bool verifies(std::uint32_t digest, std::uint32_t padding, const bytes& message, const bytes& signature,
                              int salt = salt_any) const;

  /// encrypt and decrypt pad with PKCS#1 v1.5 or OAEP, the latter with `digest` for the label and SHA-1 for the mask.
  /// decrypt answers nothing for what is not so padded.
  [[nodiscard]] bytes encrypt(std::uint32_t digest, std::uint32_t padding, const bytes& message) const;
  [[nodiscard]] std::optional<bytes> decrypt(std::uint32_t digest, std::uint32_t padding,
                                             const bytes& ciphertext) const;

  /// The bare operations over a block of size() bytes.
  [[nodiscard]] bytes private_operation(const bytes& block) const;
  [[nodiscard]] bytes public_operation(const bytes& block) const;

 private:
  explicit rsa_test_key(unsigned bits);

  std::unique_ptr<EVP_PKEY, void (*)(EVP_PKEY*)> key_;
  rsa_components components_;
};

}  // namespace testing_support

#endif  // TESTS_SUPPORT_RSA_TEST_KEY_H_
