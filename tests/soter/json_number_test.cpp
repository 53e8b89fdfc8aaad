// Numbers against the C library's own formatting, which the TA does without.
#include "soter/json_number.h"

#include <bit>
#include <cmath>
#include <cstdio>
#include <limits>
#include <random>
#include <string>

#include <gtest/gtest.h>

namespace testing_support {
namespace {

std::string formatted(double number) {
  const keymaster::json_number_text text = keymaster::json_format_number(number);
  return {text.text, text.length};
}

/// What the C library makes of it; empty when that is longer than allowed.
std::string expected(double number) {
  if (!std::isfinite(number)) return {};
  char text[400];
  const bool in_range = number > -9223372036854775808.0 && number < 9223372036854775808.0;
  const bool whole = in_range && static_cast<double>(static_cast<long long>(number)) == number;
  const int length = whole ? std::snprintf(text, sizeof text, "%lld", static_cast<long long>(number))
                           : std::snprintf(text, sizeof text, "%f", number);
  return length <= (whole ? 11 : 29) ? std::string(text) : std::string();
}

TEST(JsonNumberTest, NumbersOfTheStatementsAreWrittenInFull) {
  EXPECT_EQ(formatted(0), "0");
  EXPECT_EQ(formatted(-0.0), "0");
  EXPECT_EQ(formatted(3), "3");
  EXPECT_EQ(formatted(0.5), "0.500000");
  EXPECT_EQ(formatted(-2147483648.0), "-2147483648");
  EXPECT_EQ(formatted(4294967295.0), "4294967295");
  EXPECT_EQ(formatted(99'999'999'999.0), "99999999999");
  EXPECT_EQ(formatted(-9'999'999'999.0), "-9999999999");
}

TEST(JsonNumberTest, WhatIsTooLongHasNoText) {
  EXPECT_EQ(formatted(100'000'000'000.0), "");
  EXPECT_EQ(formatted(-10'000'000'000.0), "");
  EXPECT_EQ(formatted(9223372036854774784.0), "");  // the greatest below 2^63
  EXPECT_EQ(formatted(1e22), "");
  EXPECT_EQ(formatted(-1e21), "");
  EXPECT_EQ(formatted(std::numeric_limits<double>::max()), "");
  EXPECT_EQ(formatted(std::numeric_limits<double>::infinity()), "");
  EXPECT_EQ(formatted(-std::numeric_limits<double>::infinity()), "");
  EXPECT_EQ(formatted(std::numeric_limits<double>::quiet_NaN()), "");
  EXPECT_EQ(formatted(-std::numeric_limits<double>::signaling_NaN()), "");
}

TEST(JsonNumberTest, WhatIsNoNumberOf64BitsIsWrittenWithDecimals) {
  EXPECT_EQ(formatted(9223372036854775808.0), "9223372036854775808.000000");
  EXPECT_EQ(formatted(-9223372036854775808.0), "-9223372036854775808.000000");
  EXPECT_EQ(formatted(1e21), "1000000000000000000000.000000");
  EXPECT_EQ(formatted(9999999999999997902848.0), "9999999999999997902848.000000");  // the greatest below 10^22
}

TEST(JsonNumberTest, HalvesAreRoundedToEven) {
  // Multiples of 2^-7 end in a 5 behind six decimals: 0.0078125, 0.0234375.
  EXPECT_EQ(formatted(0.0078125), "0.007812");
  EXPECT_EQ(formatted(0.0234375), "0.023438");
  EXPECT_EQ(formatted(-0.0078125), "-0.007812");
  EXPECT_EQ(formatted(0.0000005), "0.000000");  // the double is a little less than that
  EXPECT_EQ(formatted(std::nextafter(0.0078125, 1)), "0.007813");
  EXPECT_EQ(formatted(0.99999999), "1.000000");
  EXPECT_EQ(formatted(std::numeric_limits<double>::denorm_min()), "0.000000");
  EXPECT_EQ(formatted(-std::numeric_limits<double>::denorm_min()), "-0.000000");
  for (int i = -40'000; i <= 40'000; ++i) {
    for (const double unit : {1.0 / 128, 1.0 / 256, 1.0 / 4096, 1e-6, 5e-7}) {
      ASSERT_EQ(formatted(i * unit), expected(i * unit)) << i << ' ' << unit;
    }
  }
}

TEST(JsonNumberTest, WholeNumbersAreWrittenAsTheCLibraryDoes) {
  std::mt19937_64 random(75);
  for (int round = 0; round < 300'000; ++round) {
    const double number = static_cast<double>(static_cast<std::int64_t>(random()) >> random() % 64);
    ASSERT_EQ(formatted(number), expected(number)) << number;
  }
  for (std::int64_t power = 1; power <= 1'000'000'000'000; power *= 10) {
    for (const std::int64_t near : {power - 1, power, power + 1}) {
      ASSERT_EQ(formatted(static_cast<double>(near)), expected(static_cast<double>(near)));
      ASSERT_EQ(formatted(static_cast<double>(-near)), expected(static_cast<double>(-near)));
    }
  }
}

TEST(JsonNumberTest, NumbersOfEveryMagnitudeAreWrittenAsTheCLibraryDoes) {
  std::mt19937_64 random(76);
  for (int exponent = 0; exponent < 0x800; ++exponent) {
    for (int round = 0; round < 300; ++round) {
      std::uint64_t fraction = random() >> 12;
      // Few digits as well, where ties and whole numbers are.
      if (round % 3 == 0) fraction = fraction >> random() % 52 << random() % 52 & ((std::uint64_t{1} << 52) - 1);
      const std::uint64_t bits = random() << 63 | static_cast<std::uint64_t>(exponent) << 52 | fraction;
      const auto number = std::bit_cast<double>(bits);
      ASSERT_EQ(formatted(number), expected(number)) << std::hexfloat << number;
    }
  }
}

TEST(JsonNumberTest, NumbersInReachOfTheLimitsAreWrittenAsTheCLibraryDoes) {
  std::mt19937_64 random(77);
  int written = 0;
  for (int round = 0; round < 1'000'000; ++round) {
    // 2^-25 to 2^75: from what rounds to nothing to what is too long.
    const std::uint64_t exponent = 1023 - 25 + random() % 100;
    const std::uint64_t bits = random() << 63 | exponent << 52 | random() >> 12;
    const auto number = std::bit_cast<double>(bits);
    const std::string text = formatted(number);
    ASSERT_EQ(text, expected(number)) << std::hexfloat << number;
    written += !text.empty();
  }
  EXPECT_GT(written, 500'000);
}

}  // namespace
}  // namespace testing_support
