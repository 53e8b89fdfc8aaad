#include "client/lib/utf8.h"

#include <array>
#include <bit>

namespace keymaster::client {
namespace {

/// The smallest code point that needs so many bytes. There are no sequences of one continuation byte alone.
constexpr std::array<std::uint32_t, 5> smallest = {0, 0, 0x80, 0x800, 0x10000};
constexpr std::uint32_t largest = 0x10FFFF;

bool is_surrogate(std::uint32_t code_point) {
  return code_point >= 0xD800 && code_point <= 0xDFFF;
}

/// The length of the sequence in front of `data`; 0 when there is none.
std::size_t sequence_length(byte_view data) {
  const auto length = static_cast<std::size_t>(std::countl_one(data[0]));
  if (length == 0) {
    return 1;
  }
  if (length >= smallest.size() || length < 2 || length > data.size()) {
    return 0;
  }
  std::uint32_t code_point = data[0] & (0x7FU >> length);
  for (const std::uint8_t byte : data.subspan(1, length - 1)) {
    if ((byte & 0xC0U) != 0x80) {
      return 0;
    }
    code_point = code_point << 6U | (byte & 0x3FU);
  }
  const bool well_formed = code_point >= smallest.at(length) && code_point <= largest && !is_surrogate(code_point);
  return well_formed ? length : 0;
}

}  // namespace

std::optional<std::size_t> invalid_utf8_at(byte_view data) {
  for (std::size_t at = 0; at < data.size();) {
    const std::size_t length = sequence_length(data.subspan(at));
    if (length == 0) {
      return at;
    }
    at += length;
  }
  return std::nullopt;
}

}  // namespace keymaster::client
