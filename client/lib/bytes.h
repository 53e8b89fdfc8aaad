// Byte strings of the normal world, the plain ones and those that hold secrets.
#ifndef KEYMASTER_CLIENT_LIB_BYTES_H_
#define KEYMASTER_CLIENT_LIB_BYTES_H_

#include <openssl/crypto.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string_view>
#include <vector>

namespace keymaster::client {

using bytes = std::vector<std::uint8_t>;
using byte_view = std::span<const std::uint8_t>;

/// wiping_allocator overwrites what it gives back, so that a container of secrets leaves nothing behind: neither when
/// it is destroyed nor when it grows.
template <class T>
struct wiping_allocator {
  using value_type = T;

  wiping_allocator() = default;
  template <class U>
  explicit(false) wiping_allocator(const wiping_allocator<U>& /*other*/) {}

  [[nodiscard]] T* allocate(std::size_t count) { return std::allocator<T>{}.allocate(count); }
  void deallocate(T* memory, std::size_t count) {
    OPENSSL_cleanse(memory, count * sizeof(T));
    std::allocator<T>{}.deallocate(memory, count);
  }
  friend bool operator==(const wiping_allocator&, const wiping_allocator&) { return true; }
};

/// Bytes that hold key material.
using secret_bytes = std::vector<std::uint8_t, wiping_allocator<std::uint8_t>>;

/// as_bytes views a text as its bytes; the text must outlive the view.
[[nodiscard]] inline byte_view as_bytes(std::string_view text) {
  return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

/// as_text views bytes as text; the bytes must outlive the view.
[[nodiscard]] inline std::string_view as_text(byte_view data) {
  return {reinterpret_cast<const char*>(data.data()), data.size()};
}

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_BYTES_H_
