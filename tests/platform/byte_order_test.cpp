#include "platform/byte_order.h"

#include <gtest/gtest.h>

#include "tests/support/bytes.h"

using namespace keymaster;
using namespace testing_support;

namespace {

TEST(ByteOrderTest, SwappingReversesTheBytes) {
  EXPECT_EQ(swap_u32(0x11223344), 0x44332211U);
  EXPECT_EQ(swap_u32(0xFF000000), 0x000000FFU);
  EXPECT_EQ(swap_u64(0x1122334455667788), 0x8877665544332211U);
  EXPECT_EQ(swap_u64(0xFF00000000000000), 0x00000000000000FFU);
}

TEST(ByteOrderTest, SwappingTwiceChangesNothing) {
  for (const std::uint64_t value : {0x0ULL, 0x1ULL, 0x8000000000000001ULL, 0xDEADBEEF01234567ULL}) {
    EXPECT_EQ(swap_u64(swap_u64(value)), value);
    EXPECT_EQ(swap_u32(swap_u32(static_cast<std::uint32_t>(value))), static_cast<std::uint32_t>(value));
  }
}

TEST(ByteOrderTest, NumbersAreLoadedLittleEndianFromAnyAddress) {
  const bytes data = from_hex("000102030405060708090a0b0c0d0e0f");
  for (std::size_t i = 0; i + 8 <= data.size(); ++i) {
    EXPECT_EQ(load_u32(&data[i]), u32_at(data, i));
    EXPECT_EQ(load_u64(&data[i]), u32_at(data, i) | (std::uint64_t{u32_at(data, i + 4)} << 32));
  }
}

}  // namespace
