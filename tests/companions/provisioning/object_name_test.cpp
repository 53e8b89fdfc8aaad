// Names of stored objects, as the numbers in them are written.
#include "tee/companions/common/object_name.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <string>

namespace keymaster::companion {
namespace {

TEST(ObjectName, HexNumbersHaveFourDigits) {
  for (std::uint32_t number = 0; number <= 0xFFFF; ++number) {
    char expected[8] = {};
    (void)std::snprintf(expected, sizeof expected, "%04x", number);
    ASSERT_EQ(object_name("").add_hex(static_cast<std::uint16_t>(number)).view(), expected);
  }
}

TEST(ObjectName, DecimalNumbersHaveAsManyDigitsAsTheyNeed) {
  for (const std::uint32_t number : {0U, 1U, 9U, 10U, 99U, 100U, 1'000'000'000U, 4'294'967'295U}) {
    EXPECT_EQ(object_name("").add_decimal(number).view(), std::to_string(number));
  }
}

TEST(ObjectName, PartsStandBehindEachOther) {
  EXPECT_EQ(object_name("quil.prop.").add_hex(0x1734).add(".").add_hex(9).view(), "quil.prop.1734.0009");
  EXPECT_EQ(object_name("fail.").add_decimal(10).add("x").view(), "fail.10x");
}

TEST(ObjectName, WhatGoesBeyondTheLongestNameIsCutOff) {
  const std::string longest(TEE_OBJECT_ID_MAX_LEN, 'a');
  EXPECT_EQ(object_name(longest).add("b").add_decimal(1).view(), longest);
  EXPECT_EQ(object_name(longest.substr(1)).add_hex(0xBEEF).view(), longest.substr(1) + "b");
}

}  // namespace
}  // namespace keymaster::companion
