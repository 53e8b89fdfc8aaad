// Attributes as a TA gives them, and as an object keeps them.
#ifndef TEE_CRYPTO_ATTRIBUTES_H_
#define TEE_CRYPTO_ATTRIBUTES_H_

#include <cstdint>
#include <span>
#include <vector>

#include "tee/crypto/call.h"
#include "tee/crypto/secret_bytes.h"

namespace hosted_tee {

[[nodiscard]] inline bool is_value_attribute(std::uint32_t id) {
  return (id & TEE_ATTR_FLAG_VALUE) != 0;
}

/// The attributes of one call, as the TA's memory holds them during it.
class attribute_view {
 public:
  attribute_view(const TEE_Attribute* attributes, std::uint32_t count);

  [[nodiscard]] bool has(std::uint32_t id) const { return find(id) != nullptr; }
  [[nodiscard]] bytes_view bytes(std::uint32_t id) const;           ///< of an attribute that is there
  [[nodiscard]] const TEE_Attribute* find(std::uint32_t id) const;  ///< null when absent
  [[nodiscard]] std::size_t size() const { return attributes_.size(); }

  /// is_made_of tells whether the attributes are all of `required`, and all or none of `together`, each once.
  [[nodiscard]] bool is_made_of(std::span<const std::uint32_t> required, std::span<const std::uint32_t> together) const;

 private:
  std::span<const TEE_Attribute> attributes_;
};

/// One attribute of an object: bytes, or the two numbers of a value.
struct stored_attribute {
  std::uint32_t id = 0;
  secret_bytes bytes;
  std::uint32_t a = 0;
  std::uint32_t b = 0;
};

[[nodiscard]] inline stored_attribute stored(std::uint32_t id, bytes_view bytes) {
  return {.id = id, .bytes = secret_bytes(bytes.begin(), bytes.end())};
}

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_ATTRIBUTES_H_
