#include "client/kmctl/values.h"

#include <gtest/gtest.h>

#include "client/kmctl/exit_codes.h"

namespace {

using namespace kmctl;

std::int64_t millis(std::string_view text) {
  return parse_date(text).time_since_epoch().count();
}

TEST(Values, HexadecimalReadsBothCasesAndNothingElse) {
  EXPECT_EQ(parse_hex("00fF17"), (bytes{0x00, 0xFF, 0x17}));
  EXPECT_TRUE(parse_hex("").empty());
  for (const char* const bad : {"0", "0g", "0x00", "00 11", "é0"}) {
    EXPECT_THROW((void)parse_hex(bad), usage_error) << bad;
  }
  EXPECT_EQ(to_hex(bytes{0x00, 0xFF, 0x17}), "00ff17");
}

TEST(Values, ByteStringsAreTextUnlessTheySayOtherwise) {
  EXPECT_EQ(parse_bytes("app"), (bytes{'a', 'p', 'p'}));
  EXPECT_EQ(parse_bytes("hex:0a"), (bytes{0x0A}));
  EXPECT_EQ(parse_bytes("text:hex:0a"), (bytes{'h', 'e', 'x', ':', '0', 'a'}));
  EXPECT_TRUE(parse_bytes("").empty());
  EXPECT_THROW((void)parse_bytes("@/does/not/exist"), failure_error);
}

// The expected numbers are those of `date -u -d … +%s`.
TEST(Values, DatesAreIso8601AndUtcWithoutAnOffset) {
  EXPECT_EQ(millis("1970-01-01"), 0);
  EXPECT_EQ(millis("2030-01-31"), 1896048000000);
  EXPECT_EQ(millis("2030-01-31T12:34"), 1896093240000);
  EXPECT_EQ(millis("2030-01-31T12:34:56"), 1896093296000);
  EXPECT_EQ(millis("2030-01-31 12:34:56Z"), 1896093296000);
  EXPECT_EQ(millis("2030-01-31T12:34:56.7"), 1896093296700);
  EXPECT_EQ(millis("2030-01-31T12:34:56.789123Z"), 1896093296789);
  EXPECT_EQ(millis("2030-01-31T12:34:56+02:00"), 1896086096000);
  EXPECT_EQ(millis("2030-01-31T12:34:56-0530"), 1896113096000);
  EXPECT_EQ(millis("2028-02-29"), 1835395200000);
}

TEST(Values, WhatIsNotADateIsRefused) {
  for (const char* const bad :
       {"", "tomorrow", "2030", "2030-1-1", "2030-13-01", "2029-02-29", "2030-01-32", "2030-01-31T", "2030-01-31T24:00",
        "2030-01-31T12:60", "2030-01-31T12:00:00.", "2030-01-31T12:00:00X", "2030-01-31T12:00:00Z0",
        "2030-01-31T12:00+2", "1969-12-31", "1970-01-01T00:00+01:00"}) {
    EXPECT_THROW((void)parse_date(bad), usage_error) << bad;
  }
}

TEST(Values, DatesPrintAsTheyAreRead) {
  for (const char* const text :
       {"2030-01-31T12:34:56Z", "1970-01-01T00:00:00Z", "2030-01-31T12:34:56.007Z", "9999-12-31T23:59:59.999Z"}) {
    EXPECT_EQ(format_date(static_cast<std::uint64_t>(millis(text))), text);
  }
  EXPECT_EQ(format_date(UINT64_MAX), "18446744073709551615 ms after 1970-01-01T00:00:00Z");
}

TEST(Values, NumbersStayWithinTheirRange) {
  EXPECT_EQ(parse_number("2048", UINT32_MAX), 2048U);
  EXPECT_EQ(parse_number("0x10001", UINT32_MAX), 65537U);
  EXPECT_EQ(parse_number("18446744073709551615", UINT64_MAX), UINT64_MAX);
  for (const char* const bad : {"", "-1", "+1", "1 ", "2k", "0x", "4294967296", "18446744073709551616"}) {
    EXPECT_THROW((void)parse_number(bad, UINT32_MAX), usage_error) << bad;
  }
}

TEST(Values, AnUnknownWordIsToldTheKnownOnes) {
  EXPECT_EQ(parse_name(keymaster::client::digest_names, "digest", "sha-256"), 4U);
  try {
    (void)parse_name(keymaster::client::algorithm_names, "algorithm", "dsa");
    FAIL();
  } catch (const usage_error& refused) {
    EXPECT_STREQ(refused.what(), "unknown algorithm 'dsa'");
    EXPECT_EQ(refused.hint(), "choose from: rsa, ec, aes, hmac");
  }
}

TEST(Values, SizesReadWell) {
  EXPECT_EQ(format_size(0), "0 bytes");
  EXPECT_EQ(format_size(1), "1 byte");
  EXPECT_EQ(format_size(1024), "1,024 bytes");
  EXPECT_EQ(format_size(100007), "100,007 bytes");
  EXPECT_EQ(format_size(std::uint64_t{3} << 20), "3.0 MiB");
  EXPECT_EQ(format_size(std::uint64_t{5} << 30), "5.0 GiB");
}

}  // namespace
