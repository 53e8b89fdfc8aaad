// An open handle on a persistent object.
#ifndef TEE_STORAGE_PERSISTENT_OBJECT_H_
#define TEE_STORAGE_PERSISTENT_OBJECT_H_

#include <cstdint>
#include <span>
#include <string>

#include "tee/runtime/instance.h"
#include "tee/storage/object_store.h"

namespace hosted_tee {

/// may_open applies the sharing rules (Internal Core API 1.1.2, 5.7.3) to one more handle with `flags`.
[[nodiscard]] bool may_open(object_store& store, const object_key& key, std::uint32_t flags);

/// One handle: its access rights and its data position. Counts as open in the store while it lives.
class persistent_object : public object {
 public:
  persistent_object(object_store& store, object_key key, std::uint32_t flags);
  ~persistent_object() override;

  [[nodiscard]] bool is_persistent() const override { return true; }
  [[nodiscard]] TEE_ObjectInfo info() const override;
  [[nodiscard]] bool allows(std::uint32_t access) const { return (flags_ & access) == access; }

  /// read copies up to `buffer.size()` bytes from the position on and moves it; answers how many.
  [[nodiscard]] std::uint32_t read(std::span<std::uint8_t> buffer);

  /// write replaces or appends at the position and moves it; a gap behind the old end reads as zeros.
  void write(std::span<const std::uint8_t> data);

  void truncate(std::uint32_t size);  ///< a longer stream is filled with zeros; the position stays
  void seek(std::int64_t position);   ///< before the start means the start; throws TEE_ERROR_OVERFLOW beyond the end
  void rename(const std::string& new_id);
  void remove();

  [[nodiscard]] std::uint32_t position() const { return position_; }
  [[nodiscard]] std::uint32_t size() const;

 private:
  [[nodiscard]] secret_bytes content() const;

  object_store& store_;
  object_key key_;
  std::uint32_t flags_;
  std::uint32_t position_ = 0;
};

}  // namespace hosted_tee

#endif  // TEE_STORAGE_PERSISTENT_OBJECT_H_
