// What makes a key: its attributes and, for a key pair or public key, libcrypto's form of them.
#ifndef TEE_CRYPTO_KEY_MATERIAL_H_
#define TEE_CRYPTO_KEY_MATERIAL_H_

#include <cstdint>
#include <vector>

#include "tee/crypto/attributes.h"
#include "tee/crypto/libcrypto.h"

namespace hosted_tee {

struct key_material {
  std::uint32_t bits = 0;
  std::vector<stored_attribute> attributes;  ///< numbers without leading zero bytes, secret values as given
  evp_key key;                               ///< null for a secret key

  /// find gives the attribute, or null.
  [[nodiscard]] const stored_attribute* find(std::uint32_t id) const;
};

struct object_type;

// How a key of each family comes about. Values that cannot be a key of the type are refused with
// TEE_ERROR_BAD_PARAMETERS; `type` says which attributes there are, and `given` has been compared with it.

/// Symmetric and HMAC keys. `max_bits` is the object's maximum size.
[[nodiscard]] key_material secret_from_attributes(const object_type& type, std::uint32_t max_bits,
                                                  const attribute_view& given);
[[nodiscard]] key_material generate_secret(std::uint32_t bits, const attribute_view& parameters);

/// RSA. Checked: no component is 0 or longer than `max_bits`; the modulus is odd; the exponent is odd and at least 3.
/// Nothing is tested for being prime, and the components are not compared with each other: a wrong key harms only its
/// owner, and its operations fail with a code.
[[nodiscard]] key_material rsa_from_attributes(const object_type& type, std::uint32_t max_bits,
                                               const attribute_view& given);
/// The public exponent is 65537 unless `parameters` give an odd one of at least 3.
[[nodiscard]] key_material generate_rsa(std::uint32_t bits, const attribute_view& parameters);

/// ECDSA. Checked: the point lies on the curve, and the private value lies between 1 and the curve's order - 1.
[[nodiscard]] key_material ec_from_attributes(const object_type& type, std::uint32_t max_bits,
                                              const attribute_view& given);
/// `parameters` name the curve, which has `bits` bits.
[[nodiscard]] key_material generate_ec(std::uint32_t bits, const attribute_view& parameters);

[[nodiscard]] bool is_curve_size(std::uint32_t bits);

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_KEY_MATERIAL_H_
