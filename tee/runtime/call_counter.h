// Counts by name, cheap enough for every call of the platform.
#ifndef TEE_RUNTIME_CALL_COUNTER_H_
#define TEE_RUNTIME_CALL_COUNTER_H_

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

namespace hosted_tee {

/// A hash table whose key is the address of the name, a literal: no string is compared or hashed when a call is
/// counted. The same name may lie at several addresses; count adds them up.
class call_counter {
 public:
  call_counter() : slots_(initial_slots) {}

  void add(const char* name) {
    slot& home = find(name);
    if (home.name == nullptr) {
      home.name = name;
      if (++used_ * 2 > slots_.size()) {
        grow();
        add(name);
        return;
      }
    }
    ++home.count;
  }

  [[nodiscard]] std::uint32_t count(std::string_view name) const {
    std::uint32_t sum = 0;
    for (const slot& s : slots_) {
      if (s.name != nullptr && name == s.name) sum += s.count;
    }
    return sum;
  }

  void clear() {
    slots_.assign(initial_slots, slot{});
    used_ = 0;
  }

 private:
  static constexpr std::size_t initial_slots = 256;  // a power of two, like every later size
  struct slot {
    const char* name = nullptr;
    std::uint32_t count = 0;
  };

  slot& find(const char* name) {
    const std::size_t mask = slots_.size() - 1;
    // Literals lie close together: the multiplication spreads their addresses over the table.
    std::size_t at = (reinterpret_cast<std::uintptr_t>(name) * std::uintptr_t{0x9E3779B1}) >> 12;
    while (slots_[at & mask].name != nullptr && slots_[at & mask].name != name) ++at;
    return slots_[at & mask];
  }

  void grow() {
    std::vector<slot> old(slots_.size() * 2);
    old.swap(slots_);
    for (const slot& s : old) {
      if (s.name != nullptr) find(s.name) = s;
    }
  }

  std::vector<slot> slots_;
  std::size_t used_ = 0;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_CALL_COUNTER_H_
