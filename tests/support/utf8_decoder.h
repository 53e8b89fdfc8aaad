// UTF-8 decoded by arithmetic: what a check of it is held against.
#ifndef TESTS_SUPPORT_UTF8_DECODER_H_
#define TESTS_SUPPORT_UTF8_DECODER_H_

#include <cstddef>
#include <cstdint>
#include <span>

namespace testing_support {

/// utf8_sequence answers how many bytes the character at the start of `text` has; 0 when there is none. Its value must
/// need just as many bytes as it has, and be none that is set aside.
inline std::size_t utf8_sequence(std::span<const std::uint8_t> text) {
  if (text.empty()) return 0;
  const std::uint8_t lead = text[0];
  const std::size_t size = lead < 0x80 ? 1 : (lead >> 5) == 6 ? 2 : (lead >> 4) == 14 ? 3 : (lead >> 3) == 30 ? 4 : 0;
  if (size == 0 || size > text.size()) return 0;
  std::uint32_t value = size == 1 ? lead : lead & (0x7FU >> size);
  for (const std::uint8_t next : text.subspan(1, size - 1)) {
    if (next >> 6 != 2) return 0;
    value = value << 6 | (next & 0x3FU);
  }
  const std::size_t needed = value < 0x80 ? 1 : value < 0x800 ? 2 : value < 0x10000 ? 3 : 4;
  return needed != size || value > 0x10FFFF || (value >= 0xD800 && value <= 0xDFFF) ? 0 : size;
}

inline bool is_well_formed_utf8(std::span<const std::uint8_t> text) {
  while (!text.empty()) {
    const std::size_t size = utf8_sequence(text);
    if (size == 0) return false;
    text = text.subspan(size);
  }
  return true;
}

}  // namespace testing_support

#endif  // TESTS_SUPPORT_UTF8_DECODER_H_
