// Bytes as hexadecimal digits.
#ifndef TEE_RUNTIME_HEX_H_
#define TEE_RUNTIME_HEX_H_

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace hosted_tee {

/// append_hex appends two lower-case digits a byte to `text`, a container of characters or bytes.
template <class Text>
void append_hex(Text& text, std::span<const std::uint8_t> bytes) {
  constexpr std::string_view digits = "0123456789abcdef";
  text.reserve(text.size() + bytes.size() * 2);
  for (const std::uint8_t byte : bytes) {
    text.push_back(static_cast<typename Text::value_type>(digits[byte >> 4]));
    text.push_back(static_cast<typename Text::value_type>(digits[byte & 15U]));
  }
}

[[nodiscard]] inline std::string to_hex(std::span<const std::uint8_t> bytes) {
  std::string text;
  append_hex(text, bytes);
  return text;
}

/// from_hex fills `out` from exactly twice as many digits of either case; false for any other text.
[[nodiscard]] inline bool from_hex(std::string_view text, std::span<std::uint8_t> out) {
  constexpr std::string_view digits = "0123456789abcdefABCDEF";
  if (text.size() != out.size() * 2) return false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const std::size_t digit = digits.find(text[i]);
    if (digit == std::string_view::npos) return false;
    const auto value = static_cast<std::uint8_t>(digit < 16 ? digit : digit - 6);
    out[i / 2] = static_cast<std::uint8_t>((out[i / 2] << 4) | value);
  }
  return true;
}

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_HEX_H_
