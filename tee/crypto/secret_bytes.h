// Bytes that are wiped before the host's allocator gets them back.
#ifndef TEE_CRYPTO_SECRET_BYTES_H_
#define TEE_CRYPTO_SECRET_BYTES_H_

#include <openssl/crypto.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

namespace hosted_tee {

template <class T>
struct wiping_allocator {
  using value_type = T;

  wiping_allocator() = default;
  template <class U>
  explicit wiping_allocator(const wiping_allocator<U>& /*other*/) {}

  [[nodiscard]] T* allocate(std::size_t count) { return std::allocator<T>{}.allocate(count); }
  void deallocate(T* block, std::size_t count) noexcept {
    OPENSSL_cleanse(block, count * sizeof(T));
    std::allocator<T>{}.deallocate(block, count);
  }
  friend bool operator==(const wiping_allocator& /*a*/, const wiping_allocator& /*b*/) { return true; }
};

/// Key values and what is computed from them. Growing one wipes the block it leaves.
using secret_bytes = std::vector<std::uint8_t, wiping_allocator<std::uint8_t>>;

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_SECRET_BYTES_H_
