// Wiping of secrets, and comparison that does not tell by its duration where two secrets differ.
#ifndef KEYMASTER_PLATFORM_WIPE_H_
#define KEYMASTER_PLATFORM_WIPE_H_

#include <cstdint>
#include <cstring>
#include <span>

namespace keymaster {

/// wipe sets `size` bytes to zero. The barrier tells the compiler that someone reads them, so that it cannot drop the
/// stores of memory that is about to be freed.
inline void wipe(void* bytes, std::size_t size) {
  if (bytes == nullptr) return;
  std::memset(bytes, 0, size);
  asm volatile("" : : "r"(bytes) : "memory");
}

/// wiped_array is a small array on the stack that is wiped when it goes out of scope.
template <std::size_t Size>
struct wiped_array {
  uint8_t bytes[Size] = {};
  wiped_array() = default;
  wiped_array(const wiped_array&) = delete;
  wiped_array& operator=(const wiped_array&) = delete;
  ~wiped_array() { wipe(bytes, Size); }
};

/// constant_time_equal compares in a time that depends on the lengths alone. Different lengths are unequal.
[[nodiscard]] inline bool constant_time_equal(std::span<const uint8_t> a, std::span<const uint8_t> b) {
  if (a.size() != b.size()) return false;
  uint8_t difference = 0;
  for (std::size_t i = 0; i < a.size(); ++i) {
    difference = static_cast<uint8_t>(difference | (a[i] ^ b[i]));
    asm volatile("" : "+r"(difference));  // keeps the loop from learning to stop early
  }
  return difference == 0;
}

}  // namespace keymaster

#endif  // KEYMASTER_PLATFORM_WIPE_H_
