// The object types that the platform knows: which sizes and attributes each has, and where its keys come from.
#ifndef TEE_CRYPTO_OBJECT_TYPES_H_
#define TEE_CRYPTO_OBJECT_TYPES_H_

#include <cstdint>
#include <span>

#include "tee/crypto/key_material.h"

namespace hosted_tee {

struct object_type {
  std::uint32_t id;                           ///< TEE_TYPE_*
  bool (*has_size)(std::uint32_t bits);       ///< whether a key of the type can have this size
  std::span<const std::uint32_t> required;    ///< attributes that populate the object
  std::span<const std::uint32_t> together;    ///< attributes that may be added, all of them
  std::span<const std::uint32_t> parameters;  ///< attributes that key generation takes
  bool parameters_required;                   ///< whether they may not be left out
  key_material (*from_attributes)(const object_type& type, std::uint32_t max_bits, const attribute_view& given);
  key_material (*generate)(std::uint32_t bits, const attribute_view& parameters);  ///< null for a public key
};

/// find_object_type gives the row of a TEE_TYPE_* number, or null.
[[nodiscard]] const object_type* find_object_type(std::uint32_t id);

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_OBJECT_TYPES_H_
