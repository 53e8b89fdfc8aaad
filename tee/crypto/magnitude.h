// Big-endian unsigned numbers of any length, as attributes and RSA blocks carry them.
#ifndef TEE_CRYPTO_MAGNITUDE_H_
#define TEE_CRYPTO_MAGNITUDE_H_

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <span>

#include "tee/crypto/secret_bytes.h"

namespace hosted_tee {

/// significant drops the leading zero bytes; the number 0 has none left.
[[nodiscard]] inline std::span<const std::uint8_t> significant(std::span<const std::uint8_t> number) {
  while (!number.empty() && number.front() == 0) number = number.subspan(1);
  return number;
}

/// bit_length counts the bits of a number without leading zero bytes.
[[nodiscard]] inline std::uint64_t bit_length(std::span<const std::uint8_t> number) {
  if (number.empty()) return 0;
  return (std::uint64_t{number.size()} - 1) * 8 + static_cast<std::uint64_t>(std::bit_width(number.front()));
}

[[nodiscard]] inline bool is_odd(std::span<const std::uint8_t> number) {
  return !number.empty() && (number.back() & 1) != 0;
}

/// right_aligned gives `width` bytes with the number at their end. The number must fit.
[[nodiscard]] inline secret_bytes right_aligned(std::span<const std::uint8_t> number, std::size_t width) {
  secret_bytes block(width);
  std::copy(number.begin(), number.end(), block.end() - static_cast<std::ptrdiff_t>(number.size()));
  return block;
}

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_MAGNITUDE_H_
