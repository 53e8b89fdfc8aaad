#include "platform/wipe.h"

#include <gtest/gtest.h>

#include <new>

#include "tests/support/bytes.h"

using namespace keymaster;
using namespace testing_support;

namespace {

TEST(WipeTest, ExactlyTheGivenBytesBecomeZero) {
  for (std::size_t size = 0; size <= 40; ++size) {
    bytes data(42, 0xEE);
    wipe(data.data() + 1, size);
    EXPECT_EQ(data, join({bytes(1, 0xEE), bytes(size, 0), bytes(41 - size, 0xEE)}));
  }
}

TEST(WipeTest, NothingMayBeWiped) {
  wipe(nullptr, 0);
  wipe(nullptr, 100);
}

TEST(WipedArrayTest, ItBeginsAsZerosAndLeavesZerosBehind) {
  alignas(wiped_array<48>) std::uint8_t memory[sizeof(wiped_array<48>)];
  wipe(memory, sizeof memory);
  auto* const secret = new (memory) wiped_array<48>;
  EXPECT_EQ(bytes(secret->bytes, secret->bytes + 48), bytes(48, 0));
  std::memset(secret->bytes, 0x77, sizeof secret->bytes);
  secret->~wiped_array();
  EXPECT_EQ(bytes(memory, memory + sizeof memory), bytes(48, 0));
}

TEST(ConstantTimeEqualTest, EqualBytesAreEqualWhereverTheyLie) {
  for (const std::size_t size : {0U, 1U, 16U, 32U, 69U}) {
    const bytes a = pattern(size), b = a;
    EXPECT_TRUE(constant_time_equal(a, b)) << size;
    EXPECT_TRUE(constant_time_equal(a, a)) << size;
  }
  EXPECT_TRUE(constant_time_equal({}, {}));
}

TEST(ConstantTimeEqualTest, OneDifferentBitAnywhereIsADifference) {
  const bytes a = pattern(32);
  for (std::size_t at = 0; at < a.size(); ++at) {
    for (int bit = 0; bit < 8; ++bit) {
      bytes b = a;
      b[at] = static_cast<std::uint8_t>(b[at] ^ (1 << bit));
      EXPECT_FALSE(constant_time_equal(a, b)) << at << " " << bit;
    }
  }
}

TEST(ConstantTimeEqualTest, DifferencesDoNotCancelOut) {
  EXPECT_FALSE(constant_time_equal(bytes{0x0F, 0x0F}, bytes{0xF0, 0xF0}));
  EXPECT_FALSE(constant_time_equal(bytes(256, 0x01), bytes(256, 0x00)));
}

TEST(ConstantTimeEqualTest, ThePrefixOfSomethingIsNotEqualToIt) {
  const bytes a = pattern(32);
  for (std::size_t size = 0; size < a.size(); ++size) {
    EXPECT_FALSE(constant_time_equal(a, std::span(a).first(size)));
    EXPECT_FALSE(constant_time_equal(std::span(a).first(size), a));
  }
}

}  // namespace
