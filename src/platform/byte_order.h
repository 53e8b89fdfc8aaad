// Numbers in bytes. The processor is little-endian, and so is everything that the TA stores or exchanges, except where
// a public format (an auth token's fields, an RSA exponent) is big-endian.
#ifndef KEYMASTER_PLATFORM_BYTE_ORDER_H_
#define KEYMASTER_PLATFORM_BYTE_ORDER_H_

#include <bit>
#include <cstdint>
#include <cstring>

namespace keymaster {

static_assert(std::endian::native == std::endian::little, "formats are written in the processor's own byte order");

/// swap_u32 and swap_u64 reverse the bytes of a number: big-endian to native and back.
[[nodiscard]] constexpr uint32_t swap_u32(uint32_t value) {
  return __builtin_bswap32(value);
}
[[nodiscard]] constexpr uint64_t swap_u64(uint64_t value) {
  return __builtin_bswap64(value);
}

/// load_u32 and load_u64 read a native number from any address.
[[nodiscard]] inline uint32_t load_u32(const uint8_t* bytes) {
  uint32_t value = 0;
  std::memcpy(&value, bytes, sizeof value);
  return value;
}
[[nodiscard]] inline uint64_t load_u64(const uint8_t* bytes) {
  uint64_t value = 0;
  std::memcpy(&value, bytes, sizeof value);
  return value;
}

}  // namespace keymaster

#endif  // KEYMASTER_PLATFORM_BYTE_ORDER_H_
