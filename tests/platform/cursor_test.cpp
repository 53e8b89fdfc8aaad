// The cursors at every bound: lengths of a hostile client must never move them past their end.
#include "platform/cursor.h"

#include <gtest/gtest.h>

#include <memory>

#include "tests/support/bytes.h"

using namespace keymaster;
using namespace testing_support;

namespace {

/// Lengths around 2^31 and 2^32, where sums with small offsets wrap.
constexpr std::uint32_t huge_lengths[] = {0x7FFFFFFC, 0x7FFFFFFF, 0x80000000, 0xFFFFFFF0, 0xFFFFFFF8,
                                          0xFFFFFFFB, 0xFFFFFFFC, 0xFFFFFFFD, 0xFFFFFFFE, 0xFFFFFFFF};

/// A copy in a block of exactly its size, so that the address sanitizer watches both ends.
class exact_bytes {
 public:
  explicit exact_bytes(const bytes& data) : block_(new std::uint8_t[data.size()]), size_(data.size()) {
    std::copy(data.begin(), data.end(), block_.get());
  }
  [[nodiscard]] std::span<std::uint8_t> span() const {
    // The compiler must not know the size: it would warn of the very accesses that the cursors are to refuse.
    std::uint8_t* data = block_.get();
    std::size_t size = size_;
    asm volatile("" : "+r"(data), "+r"(size));
    return {data, size};
  }
  [[nodiscard]] bytes content() const { return {block_.get(), block_.get() + size_}; }

 private:
  std::unique_ptr<std::uint8_t[]> block_;
  std::size_t size_;
};

TEST(ByteReaderTest, NumbersAreReadFrontToBack) {
  const exact_bytes data(from_hex("0102030405060708"));
  byte_reader in{data.span()};
  std::uint32_t value = 0;
  EXPECT_EQ(in.remaining(), 8U);
  ASSERT_TRUE(in.read_u32(value));
  EXPECT_EQ(value, 0x04030201U);
  ASSERT_TRUE(in.read_u32(value));
  EXPECT_EQ(value, 0x08070605U);
  EXPECT_EQ(in.remaining(), 0U);
}

TEST(ByteReaderTest, ANumberNeedsFourBytes) {
  for (std::size_t size = 0; size < 4; ++size) {
    const exact_bytes data(pattern(size));
    byte_reader in{data.span()};
    std::uint32_t value = 77;
    EXPECT_FALSE(in.read_u32(value));
    EXPECT_EQ(value, 77U);
    EXPECT_EQ(in.remaining(), size) << "a read that does not fit moves nothing";
  }
}

TEST(ByteReaderTest, ANumberMayStandAtAnyAddress) {
  for (std::uint32_t shift = 0; shift < 8; ++shift) {
    const exact_bytes data(join({pattern(shift), from_hex("efbeadde")}));
    byte_reader in{data.span()};
    std::span<const std::uint8_t> skipped;
    std::uint32_t value = 0;
    ASSERT_TRUE(in.read_bytes(shift, skipped));
    ASSERT_TRUE(in.read_u32(value));
    EXPECT_EQ(value, 0xDEADBEEFU);
  }
}

TEST(ByteReaderTest, BytesAreAViewOfTheBuffer) {
  const exact_bytes data(pattern(10));
  byte_reader in{data.span()};
  std::span<const std::uint8_t> first, second, none;
  ASSERT_TRUE(in.read_bytes(3, first));
  ASSERT_TRUE(in.read_bytes(0, none));
  ASSERT_TRUE(in.read_bytes(7, second));
  EXPECT_EQ(first.data(), data.span().data());
  EXPECT_EQ(second.data(), data.span().data() + 3);
  EXPECT_EQ(second.size(), 7U);
  EXPECT_TRUE(none.empty());
}

TEST(ByteReaderTest, ALengthBeyondTheEndIsRefusedAndMovesNothing) {
  const exact_bytes data(pattern(16));
  for (std::uint32_t taken = 0; taken <= 16; ++taken) {
    byte_reader in{data.span()};
    std::span<const std::uint8_t> out;
    ASSERT_TRUE(in.read_bytes(taken, out));
    EXPECT_FALSE(in.read_bytes(16 - taken + 1, out));
    for (const std::uint32_t length : huge_lengths) EXPECT_FALSE(in.read_bytes(length, out)) << length;
    EXPECT_EQ(in.remaining(), 16 - taken);
    EXPECT_EQ(in.rest().data(), data.span().data() + taken);
    EXPECT_EQ(out.size(), taken) << "the answer of a refused read is the caller's old one";
  }
}

TEST(ByteReaderTest, ABlockIsALengthAndItsBytes) {
  const exact_bytes data(join({prefixed(from_text("first")), prefixed({}), prefixed(from_text("last"))}));
  byte_reader in{data.span()};
  std::span<const std::uint8_t> block;
  ASSERT_TRUE(in.read_block(block));
  EXPECT_EQ(bytes(block.begin(), block.end()), from_text("first"));
  ASSERT_TRUE(in.read_block(block));
  EXPECT_TRUE(block.empty());
  ASSERT_TRUE(in.read_block(block));
  EXPECT_EQ(bytes(block.begin(), block.end()), from_text("last"));
  EXPECT_FALSE(in.read_block(block));
}

TEST(ByteReaderTest, ABlockThatRunsPastTheEndMovesNothingNotEvenItsLength) {
  for (std::uint32_t length : {6U, 7U, 100U}) {
    const exact_bytes data(join({u32(length), pattern(5)}));
    byte_reader in{data.span()};
    std::span<const std::uint8_t> block;
    EXPECT_FALSE(in.read_block(block));
    EXPECT_EQ(in.remaining(), 9U);
  }
  for (const std::uint32_t length : huge_lengths) {
    const exact_bytes data(join({u32(length), pattern(5)}));
    byte_reader in{data.span()};
    std::span<const std::uint8_t> block;
    EXPECT_FALSE(in.read_block(block)) << length;
    EXPECT_EQ(in.remaining(), 9U) << length;
    EXPECT_TRUE(block.empty());
  }
  const exact_bytes cut(pattern(3));
  byte_reader in{cut.span()};
  std::span<const std::uint8_t> block;
  EXPECT_FALSE(in.read_block(block));
  EXPECT_EQ(in.remaining(), 3U);
}

TEST(ByteReaderTest, CopiesFitOrAreNotMade) {
  const exact_bytes data(from_hex("a0a1a2a3")), target(bytes(4, 0xEE));
  byte_reader in{data.span()};
  EXPECT_FALSE(in.copy_to(target.span().data(), 5));
  for (const std::uint32_t length : huge_lengths) EXPECT_FALSE(in.copy_to(target.span().data(), length));
  EXPECT_EQ(target.content(), bytes(4, 0xEE));
  ASSERT_TRUE(in.copy_to(target.span().data(), 3));
  EXPECT_EQ(to_hex(target.content()), "a0a1a2ee");
  EXPECT_EQ(in.remaining(), 1U);
  EXPECT_TRUE(in.copy_to(nullptr, 0)) << "nothing needs no place";
}

TEST(ByteReaderTest, AnEmptyBufferNeedsNoAddress) {
  byte_reader in{{}};
  std::uint32_t value = 0;
  std::span<const std::uint8_t> out;
  EXPECT_EQ(in.remaining(), 0U);
  EXPECT_FALSE(in.read_u32(value));
  EXPECT_FALSE(in.read_block(out));
  EXPECT_FALSE(in.read_bytes(1, out));
  EXPECT_TRUE(in.read_bytes(0, out));
}

TEST(ByteWriterTest, FieldsAreWrittenFrontToBack) {
  const exact_bytes target(bytes(9, 0xEE));
  byte_writer out{target.span()};
  const bytes text = from_text("abc");
  ASSERT_TRUE(out.write_u32(0x11223344));
  ASSERT_TRUE(out.write_bytes(text.data(), 3));
  EXPECT_EQ(out.written(), 7U);
  EXPECT_EQ(out.remaining(), 2U);
  EXPECT_EQ(out.rest().data(), target.span().data() + 7);
  EXPECT_EQ(to_hex(target.content()), "44332211616263eeee");
}

TEST(ByteWriterTest, WhatDoesNotFitIsNotWrittenAtAll) {
  for (std::uint32_t used = 0; used <= 8; ++used) {
    const exact_bytes target(bytes(8, 0xEE));
    byte_writer out{target.span()};
    const bytes filling(9, 0x11);
    ASSERT_TRUE(out.write_bytes(filling.data(), used));
    EXPECT_FALSE(out.write_bytes(filling.data(), 8 - used + 1));
    if (used > 4) {
      EXPECT_FALSE(out.write_u32(1));
    }
    EXPECT_EQ(out.written(), used);
    EXPECT_EQ(target.content(), join({bytes(used, 0x11), bytes(8 - used, 0xEE)}));
  }
}

TEST(ByteWriterTest, AHugeLengthIsRefusedWhereverTheWriterStands) {
  for (std::uint32_t used = 0; used <= 8; ++used) {
    const exact_bytes target(bytes(8, 0xEE));
    byte_writer out{target.span()};
    std::span<std::uint8_t> place;
    ASSERT_TRUE(out.reserve(used, place));
    for (const std::uint32_t length : huge_lengths) {
      EXPECT_FALSE(out.reserve(length, place)) << used << " " << length;
      EXPECT_FALSE(out.write_bytes(target.span().data(), length)) << used << " " << length;
    }
    EXPECT_EQ(out.written(), used);
    EXPECT_EQ(out.remaining(), 8 - used);
    EXPECT_EQ(place.size(), used);
  }
}

TEST(ByteWriterTest, AReservedPlaceIsPartOfTheBuffer) {
  const exact_bytes target(bytes(6, 0xEE));
  byte_writer out{target.span()};
  std::span<std::uint8_t> length_place, body;
  ASSERT_TRUE(out.reserve(4, length_place));
  ASSERT_TRUE(out.reserve(2, body));
  body[0] = body[1] = 0x42;
  EXPECT_EQ(length_place.data(), target.span().data());
  EXPECT_EQ(to_hex(target.content()), "eeeeeeee4242");
  EXPECT_TRUE(out.reserve(0, body));
  EXPECT_FALSE(out.reserve(1, body));
}

TEST(ByteWriterTest, AnEmptyBufferTakesNothing) {
  byte_writer out{{}};
  const std::uint8_t byte = 1;
  EXPECT_FALSE(out.write_u32(1));
  EXPECT_FALSE(out.write_bytes(&byte, 1));
  EXPECT_TRUE(out.write_bytes(nullptr, 0));
  EXPECT_EQ(out.written(), 0U);
}

}  // namespace
