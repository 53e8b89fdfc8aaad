// Transient objects: keys in memory.
#ifndef TEE_CRYPTO_TRANSIENT_OBJECT_H_
#define TEE_CRYPTO_TRANSIENT_OBJECT_H_

#include "tee/crypto/key_material.h"
#include "tee/crypto/object_types.h"
#include "tee/runtime/instance.h"

namespace hosted_tee {

/// A typed container of a maximum size that is empty, or holds one key. Its usage starts with every right and only ever
/// loses some, until it is reset.
class transient_object : public object {
 public:
  /// `max_bits` must be a size that `type` has.
  transient_object(const object_type& type, std::uint32_t max_bits) : type_(type), max_bits_(max_bits) {}

  [[nodiscard]] bool is_persistent() const override { return false; }
  [[nodiscard]] TEE_ObjectInfo info() const override;

  [[nodiscard]] const object_type& type() const { return type_; }
  [[nodiscard]] std::uint32_t max_bits() const { return max_bits_; }
  [[nodiscard]] std::uint32_t usage() const { return usage_; }
  [[nodiscard]] bool holds_key() const { return material_.bits != 0; }
  [[nodiscard]] const key_material& material() const { return material_; }

  void set_material(key_material material) { material_ = std::move(material); }
  void restrict_usage(std::uint32_t usage) { usage_ &= usage; }
  void reset();

 private:
  static constexpr std::uint32_t every_usage = 0xFFFFFFFF;

  const object_type& type_;
  std::uint32_t max_bits_;
  std::uint32_t usage_ = every_usage;
  key_material material_;
};

/// The object of a handle; panics when there is none, and find_transient_object also when it is a persistent one.
[[nodiscard]] object& find_object(const instance& self, TEE_ObjectHandle handle);
[[nodiscard]] transient_object& find_transient_object(const instance& self, TEE_ObjectHandle handle);

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_TRANSIENT_OBJECT_H_
