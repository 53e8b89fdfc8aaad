// Well-formed UTF-8: every code point, every pair of bytes, and what only looks like it.
#include "client/lib/utf8.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace {

using keymaster::client::as_bytes;
using keymaster::client::bytes;
using keymaster::client::invalid_utf8_at;

/// The encoding of a code point as the standard draws it, whether it may be encoded or not.
bytes encode(std::uint32_t point) {
  const auto last = [&](int shift) { return static_cast<std::uint8_t>(0x80U | (point >> shift & 0x3FU)); };
  if (point < 0x80) {
    return {static_cast<std::uint8_t>(point)};
  }
  if (point < 0x800) {
    return {static_cast<std::uint8_t>(0xC0U | point >> 6U), last(0)};
  }
  if (point < 0x10000) {
    return {static_cast<std::uint8_t>(0xE0U | point >> 12U), last(6), last(0)};
  }
  return {static_cast<std::uint8_t>(0xF0U | point >> 18U), last(12), last(6), last(0)};
}

TEST(Utf8, EveryCodePointButTheSurrogatesIsText) {
  for (std::uint32_t point = 0; point <= 0x110400; ++point) {
    const bool text = point <= 0x10FFFF && (point < 0xD800 || point > 0xDFFF);
    ASSERT_EQ(invalid_utf8_at(encode(point)), text ? std::nullopt : std::optional<std::size_t>(0)) << point;
  }
}

TEST(Utf8, OfTwoBytesOnlyAsciiAndTheSequencesOfTwoAreText) {
  for (std::uint32_t both = 0; both < 0x10000; ++both) {
    const bytes data = {static_cast<std::uint8_t>(both >> 8U), static_cast<std::uint8_t>(both)};
    const bool ascii = data[0] < 0x80 && data[1] < 0x80;
    const bool sequence = data[0] >= 0xC2 && data[0] <= 0xDF && data[1] >= 0x80 && data[1] <= 0xBF;
    ASSERT_EQ(!invalid_utf8_at(data), ascii || sequence) << both;
  }
}

TEST(Utf8, OverlongFormsAndCutSequencesAreRefusedWhereTheyBegin) {
  for (const char* const text :
       {"ab\xC0\xAF", "ab\xC1\xBF", "ab\xE0\x80\xAF", "ab\xE0\x9F\xBF", "ab\xF0\x80\x80\xAF", "ab\xF0\x8F\xBF\xBF",
        "ab\xF4\x90\x80\x80", "ab\xF8\x88\x80\x80\x80", "ab\xFE", "ab\xFF", "ab\x80", "ab\xE2\x82", "ab\xF0\x9F\x98",
        "ab\xC3", "ab\xE2\x28\xA1", "ab\xED\xA0\x80"}) {
    EXPECT_EQ(invalid_utf8_at(as_bytes(text)), 2U) << text;
  }
  EXPECT_EQ(invalid_utf8_at(as_bytes("\u20AC\U0001F600 and \u00E9")), std::nullopt);
  EXPECT_EQ(invalid_utf8_at({}), std::nullopt);
}

}  // namespace
