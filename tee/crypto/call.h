// How the cryptographic functions of the API run: a refusal is thrown where it is found and becomes the call's result
// in one place; a mistake of the TA panics.
#ifndef TEE_CRYPTO_CALL_H_
#define TEE_CRYPTO_CALL_H_

#include <cstdint>
#include <span>
#include <utility>

#include "tee/crypto/libcrypto.h"
#include "tee/runtime/platform_call.h"

namespace hosted_tee {

using bytes_view = std::span<const std::uint8_t>;

/// refuse ends the call with `code`, and the TA goes on.
[[noreturn]] inline void refuse(TEE_Result code) {
  throw call_failure(code);
}

/// refuse_unless refuses with `code` when the condition doesn't hold; panic_unless ends the instance.
inline void refuse_unless(bool holds, TEE_Result code) {
  if (!holds) refuse(code);
}
inline void panic_unless(bool holds, const char* reason) {
  if (!holds) panic(reason);
}

/// input is the `size` bytes at `data`. Null with a size is refused with TEE_ERROR_BAD_PARAMETERS.
[[nodiscard]] inline bytes_view input(const void* data, std::uint32_t size) {
  refuse_unless(data != nullptr || size == 0, TEE_ERROR_BAD_PARAMETERS);
  return {static_cast<const std::uint8_t*>(data), size};
}

/// pointer_to is never null, not even for no bytes: some of libcrypto's functions take null as another request.
[[nodiscard]] inline const std::uint8_t* pointer_to(bytes_view bytes) {
  static const std::uint8_t nothing = 0;
  return bytes.empty() ? &nothing : bytes.data();
}

/// The buffer that a call fills: `*length` is its capacity on entry and what was written on return. A null buffer has
/// no capacity, so it asks for the size.
class output {
 public:
  output(void* data, std::uint32_t* length) : data_(static_cast<std::uint8_t*>(data)), length_(length) {
    panic_unless(length != nullptr, "no output length");
    capacity_ = data == nullptr ? 0 : *length;
  }

  /// room gives the place for `needed` bytes (null for none in a null buffer), or refuses with TEE_ERROR_SHORT_BUFFER
  /// and leaves `needed` in the length.
  [[nodiscard]] std::uint8_t* room(std::uint64_t needed) const {
    if (needed > capacity_) {
      *length_ = static_cast<std::uint32_t>(needed);
      refuse(TEE_ERROR_SHORT_BUFFER);
    }
    return data_;
  }
  void written(std::uint64_t count) const { *length_ = static_cast<std::uint32_t>(count); }

  /// put copies all of `bytes`, or refuses as room does.
  void put(bytes_view bytes) const;

 private:
  std::uint8_t* data_;
  std::uint32_t* length_;
  std::uint32_t capacity_ = 0;
};

/// crypto_call is platform_call for a body that refuses by throwing.
template <class Body>
TEE_Result crypto_call(const char* name, std::uint32_t* length, Body&& body) noexcept {
  return platform_call(name, length, [&](instance& self) -> TEE_Result {
    const error_queue_scope own_errors;
    try {
      std::forward<Body>(body)(self);
      return TEE_SUCCESS;
    } catch (const call_failure& refusal) {
      // Caught here so that an ordered falsification sees refusals too.
      if (length != nullptr && refusal.code() != TEE_ERROR_SHORT_BUFFER) *length = 0;
      return refusal.code();
    }
  });
}

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_CALL_H_
