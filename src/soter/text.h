// NUL-terminated text, as properties and statements have it.
#ifndef KEYMASTER_SOTER_TEXT_H_
#define KEYMASTER_SOTER_TEXT_H_

#include <cstdint>
#include <span>

namespace keymaster {

/// text_length counts the bytes of a text before its NUL.
[[nodiscard]] constexpr uint32_t text_length(const char* text) {
  uint32_t length = 0;
  while (text[length] != '\0') ++length;
  return length;
}

/// text_bytes views a text without its NUL.
[[nodiscard]] inline std::span<const uint8_t> text_bytes(const char* text) {
  return {reinterpret_cast<const uint8_t*>(text), text_length(text)};
}

/// is_utf8 tells whether the bytes are well-formed UTF-8 as the Unicode standard defines it (section 3.9, table 3-7):
/// no overlong forms, no surrogates, nothing above U+10FFFF. What readers of a statement would disagree about is not
/// signed.
[[nodiscard]] bool is_utf8(std::span<const uint8_t> bytes);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_TEXT_H_
