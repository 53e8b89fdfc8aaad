#include "soter/json_number.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>

namespace keymaster {
namespace {

/// A finite double (IEEE 754, binary64): (negative ? -1 : 1) * mantissa * 2^exponent.
struct binary_number {
  bool negative;
  uint64_t mantissa;
  int exponent;
};

constexpr int fraction_bits = 52;
constexpr int exponent_of_all_ones = 0x7FF;
constexpr int exponent_bias = 1075;  // of the mantissa taken as a whole number

bool take_apart(double number, binary_number& parts) {
  const uint64_t bits = std::bit_cast<uint64_t>(number);
  const uint64_t fraction = bits & ((uint64_t{1} << fraction_bits) - 1);
  const int stored = static_cast<int>(bits >> fraction_bits) & exponent_of_all_ones;
  if (stored == exponent_of_all_ones) return false;
  const bool subnormal = stored == 0;
  parts.negative = bits >> 63 != 0;
  parts.mantissa = subnormal ? fraction : fraction | (uint64_t{1} << fraction_bits);
  parts.exponent = (subnormal ? 1 : stored) - exponent_bias;
  return true;
}

/// A whole number of 128 bits, in limbs of 16 so that every step fits the processor's own 32-bit arithmetic.
class wide_number {
 public:
  explicit wide_number(uint64_t value) {
    for (uint32_t i = 0; i < 4; ++i) limbs_[i] = static_cast<uint16_t>(value >> (16 * i));
  }

  void multiply(uint16_t factor) {
    uint32_t carry = 0;
    for (uint16_t& limb : limbs_) {
      carry += uint32_t{limb} * factor;
      limb = static_cast<uint16_t>(carry);
      carry >>= 16;
    }
  }
  /// Divides by ten and answers the remainder.
  uint32_t next_digit() {
    uint32_t rest = 0;
    for (std::size_t i = limbs_.size(); i-- > 0;) {
      rest = rest << 16 | limbs_[i];
      limbs_[i] = static_cast<uint16_t>(rest / 10);
      rest %= 10;
    }
    return rest;
  }
  /// Divides by two and answers the bit that falls out.
  bool halve() {
    uint32_t carry = 0;
    for (std::size_t i = limbs_.size(); i-- > 0;) {
      carry = carry << 16 | limbs_[i];
      limbs_[i] = static_cast<uint16_t>(carry >> 1);
      carry &= 1;
    }
    return carry != 0;
  }
  void increment() {
    for (uint16_t& limb : limbs_) {
      if (++limb != 0) return;
    }
  }
  [[nodiscard]] bool odd() const { return (limbs_[0] & 1) != 0; }
  [[nodiscard]] bool zero() const {
    return std::all_of(limbs_.begin(), limbs_.end(), [](uint16_t limb) { return limb == 0; });
  }

 private:
  std::array<uint16_t, 8> limbs_ = {};
};

/// Multiplies by 2^exponent; what falls below 1 is rounded half to even.
void scale(wide_number& number, int exponent) {
  for (; exponent > 0; --exponent) number.multiply(2);
  bool half = false, more = false;
  for (; exponent < 0; ++exponent) {
    more = more || half;
    half = number.halve();
  }
  if (half && (more || number.odd())) number.increment();
}

/// Writes the number with `decimals` digits behind a point. No text: it would be longer than `limit`.
json_number_text write_decimal(bool negative, wide_number number, uint32_t decimals, uint32_t limit) {
  json_number_text result;
  uint32_t start = limit;
  const auto put = [&](char character) {
    if (start == 0) return false;
    result.text[--start] = character;
    return true;
  };
  for (uint32_t digits = 0; digits <= decimals || !number.zero(); ++digits) {
    if (digits == decimals && decimals != 0 && !put('.')) return {};
    if (!put(static_cast<char>('0' + number.next_digit()))) return {};
  }
  if (negative && !put('-')) return {};
  std::copy(result.text + start, result.text + limit, result.text);
  result.length = limit - start;
  return result;
}

bool is_whole(const binary_number& parts) {
  if (parts.mantissa == 0 || parts.exponent >= 0) return true;
  return parts.exponent > -64 && (parts.mantissa & ((uint64_t{1} << -parts.exponent) - 1)) == 0;
}

constexpr uint64_t one_million_root = 1000;

}  // namespace

json_number_text json_format_number(double number) {
  binary_number parts = {};
  if (!take_apart(number, parts)) return {};
  wide_number value{parts.mantissa};
  // A mantissa has 53 bits at most, so that 2^10 times as much stays below 2^63.
  if (is_whole(parts) && parts.exponent <= 10) {
    scale(value, parts.exponent);
    return write_decimal(parts.negative && parts.mantissa != 0, value, 0, json_whole_number_limit);
  }
  // From 2^74 on a number has 23 digits before the point: too long, and no longer in reach of 128 bits in the end.
  if (parts.exponent > 21) return {};
  value.multiply(one_million_root);
  value.multiply(one_million_root);
  scale(value, parts.exponent);
  return write_decimal(parts.negative, value, 6, json_fraction_limit);
}

}  // namespace keymaster
