// Handles that a TA holds: opaque, never zero, never reused within an instance, so that a stale or invented one is
// always recognised.
#ifndef TEE_RUNTIME_HANDLE_TABLE_H_
#define TEE_RUNTIME_HANDLE_TABLE_H_

#include <cstdint>
#include <memory>
#include <unordered_map>
#include <utility>

namespace hosted_tee {

/// Owns what it holds. Handle is one of the API's opaque pointer types; it is never dereferenced.
template <class T, class Handle>
class handle_table {
 public:
  Handle insert(std::unique_ptr<T> item) {
    next_ += 16;
    items_.emplace(next_, std::move(item));
    return reinterpret_cast<Handle>(next_);  // NOLINT(performance-no-int-to-ptr): an opaque number, as the API has it
  }
  [[nodiscard]] T* find(Handle handle) const {
    const auto it = items_.find(reinterpret_cast<std::uintptr_t>(handle));
    return it == items_.end() ? nullptr : it->second.get();
  }
  bool erase(Handle handle) { return items_.erase(reinterpret_cast<std::uintptr_t>(handle)) == 1; }
  [[nodiscard]] std::size_t size() const { return items_.size(); }
  [[nodiscard]] auto begin() const { return items_.begin(); }
  [[nodiscard]] auto end() const { return items_.end(); }

 private:
  std::uintptr_t next_ = 0x1000;
  std::unordered_map<std::uintptr_t, std::unique_ptr<T>> items_;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_HANDLE_TABLE_H_
