// The UTF-8 check against a decoder written down from the definition: every sequence of up to three bytes, and four.
#include <random>

#include "soter/text.h"
#include "tests/support/bytes.h"
#include "tests/support/utf8_decoder.h"

#include <gtest/gtest.h>

namespace testing_support {
namespace {

TEST(Utf8Test, EverySequenceOfOneToThreeBytesIsJudgedAsDefined) {
  std::uint32_t accepted = 0;
  std::uint8_t text[3];
  for (std::uint32_t size = 1; size <= 3; ++size) {
    for (std::uint32_t number = 0; number < 1U << (8 * size); ++number) {
      for (std::uint32_t i = 0; i < size; ++i) text[i] = static_cast<std::uint8_t>(number >> (8 * i));
      const std::span<const std::uint8_t> sequence(text, size);
      const bool expected = is_well_formed_utf8(sequence);
      if (keymaster::is_utf8(sequence) != expected) FAIL() << to_hex(sequence);
      accepted += expected;
    }
  }
  // 128 + (128^2 + 1920) + (128^3 + 2 * 128 * 1920 + 61440): all that Unicode has in so many bytes.
  EXPECT_EQ(accepted, 128U + 16384 + 1920 + 2097152 + 491520 + 61440);
}

TEST(Utf8Test, SequencesOfFourBytesAreJudgedAsDefined) {
  std::mt19937 random(8);
  std::uint32_t accepted = 0;
  for (int round = 0; round < 2'000'000; ++round) {
    std::uint8_t text[4];
    for (std::uint8_t& byte : text) byte = static_cast<std::uint8_t>(0x80 + random() % 0x40);
    text[0] = static_cast<std::uint8_t>(random() % 16 == 0 ? random() : 0xF0 + random() % 8);
    if (random() % 8 == 0) text[random() % 4] = static_cast<std::uint8_t>(random());
    const bool expected = is_well_formed_utf8(text);
    if (keymaster::is_utf8(text) != expected) FAIL() << to_hex(text);
    accepted += expected;
  }
  EXPECT_GT(accepted, 100'000U);
}

TEST(Utf8Test, TheEdgesOfFourBytesAreExact) {
  for (const char* const good : {"f0908080", "f48fbfbf", "f0bfbfbf", "f1808080", "f3bfbfbf"}) {
    EXPECT_TRUE(keymaster::is_utf8(from_hex(good))) << good;
  }
  for (const char* const bad : {"f08fbfbf", "f4908080", "f5808080", "f8808080", "f0908080f0", "f09080", "ff", "fe"}) {
    EXPECT_FALSE(keymaster::is_utf8(from_hex(bad))) << bad;
  }
}

TEST(Utf8Test, EveryCutOfALongTextIsJudgedAsDefined) {
  const bytes text = from_text("a\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80z\xED\x9F\xBF\xEE\x80\x80");
  ASSERT_TRUE(keymaster::is_utf8(text));
  for (std::size_t from = 0; from <= text.size(); ++from) {
    for (std::size_t to = from; to <= text.size(); ++to) {
      const std::span<const std::uint8_t> part(text.data() + from, to - from);
      EXPECT_EQ(keymaster::is_utf8(part), is_well_formed_utf8(part)) << from << ' ' << to;
    }
  }
}

}  // namespace
}  // namespace testing_support
