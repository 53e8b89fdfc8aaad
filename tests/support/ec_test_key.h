// Fixed EC key pairs that libcrypto and the TA both know, so that each checks what the other made.
#ifndef TESTS_SUPPORT_EC_TEST_KEY_H_
#define TESTS_SUPPORT_EC_TEST_KEY_H_

#include <openssl/evp.h>

#include <array>
#include <memory>

#include "tests/support/param_list.h"

namespace testing_support {

/// The sizes of the five curves, in bits.
inline constexpr std::array<std::uint32_t, 5> ec_sizes = {192, 224, 256, 384, 521};

/// An EC public key or key pair in the TA's layout; the order of its fields.
struct ec_fields {
  std::uint32_t bits = 0;
  bytes x, y, d;

  [[nodiscard]] bytes material() const;         ///< all fields: import material and key data
  [[nodiscard]] bytes public_material() const;  ///< without D: what export answers
  [[nodiscard]] std::size_t half() const { return (bits + 7) / 8; }

  /// parse reads key data, or with `with_d` false an exported key; throws std::runtime_error unless it is whole and
  /// nothing follows.
  static ec_fields parse(std::span<const std::uint8_t> data, bool with_d);
};

/// libcrypto's view of a public point or, with D, of a key pair. KM_DIGEST_NONE stands for no digest: the message is
/// the digest. What libcrypto refuses throws std::runtime_error.
class ec_test_key {
 public:
  /// of_bits answers the fixed key of a size, from tests/data, made with `openssl genpkey`.
  static const ec_test_key& of_bits(std::uint32_t bits);

  /// from_fields makes a key of coordinates that libcrypto has to accept; D may be absent.
  static ec_test_key from_fields(const ec_fields& fields);

  [[nodiscard]] const ec_fields& fields() const { return fields_; }
  [[nodiscard]] bytes material() const { return fields_.material(); }

  /// spki is the public key as libcrypto encodes it: a DER SubjectPublicKeyInfo.
  [[nodiscard]] bytes spki() const;

  /// sign answers the DER signature, and verifies judges one.
  [[nodiscard]] bytes sign(std::uint32_t digest, const bytes& message) const;
  [[nodiscard]] bool verifies(std::uint32_t digest, const bytes& message, const bytes& signature) const;

 private:
  ec_test_key(EVP_PKEY* key, ec_fields fields);

  std::shared_ptr<EVP_PKEY> key_;
  ec_fields fields_;
};

/// raw_of takes a DER signature apart: r and s, each `half` bytes. der_of joins two numbers, as libcrypto encodes them.
bytes raw_of(const bytes& der, std::size_t half);
bytes der_of(const bytes& r, const bytes& s);

/// ec_order answers the order of a curve's base point, in whole bytes.
bytes ec_order(std::uint32_t bits);

/// ec_key asks for an EC key that signs and verifies with any digest and needs no user. ec_digest asks for an
/// operation.
param_list ec_key(std::uint32_t bits);
param_list ec_digest(std::uint32_t digest);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_EC_TEST_KEY_H_
