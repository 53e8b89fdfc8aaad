// Symmetric and HMAC keys, and what all key material shares.
#include <openssl/rand.h>

#include <algorithm>

#include "tee/crypto/key_material.h"
#include "tee/crypto/object_types.h"

namespace hosted_tee {

const stored_attribute* key_material::find(std::uint32_t id) const {
  const auto found =
      std::find_if(attributes.begin(), attributes.end(), [&](const stored_attribute& each) { return each.id == id; });
  return found == attributes.end() ? nullptr : &*found;
}

key_material secret_from_attributes(const object_type& type, std::uint32_t max_bits, const attribute_view& given) {
  const bytes_view value = given.bytes(TEE_ATTR_SECRET_VALUE);
  refuse_unless(value.size() <= max_bits / 8, TEE_ERROR_BAD_PARAMETERS);
  const auto bits = static_cast<std::uint32_t>(value.size() * 8);
  refuse_unless(type.has_size(bits), TEE_ERROR_BAD_PARAMETERS);
  key_material material;
  material.bits = bits;
  material.attributes.push_back(stored(TEE_ATTR_SECRET_VALUE, value));
  return material;
}

key_material generate_secret(std::uint32_t bits, const attribute_view& /*parameters*/) {
  secret_bytes value(bits / 8);
  refuse_unless(RAND_priv_bytes(value.data(), static_cast<int>(value.size())) == 1, TEE_ERROR_GENERIC);
  key_material material;
  material.bits = bits;
  material.attributes.push_back({.id = TEE_ATTR_SECRET_VALUE, .bytes = std::move(value)});
  return material;
}

}  // namespace hosted_tee
