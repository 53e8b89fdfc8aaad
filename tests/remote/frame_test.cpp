// Frames against bytes that were put together by hand, from the description of the wire.
#include <gmock/gmock.h>

#include "tee/remote/frame.h"
#include "tests/support/bytes.h"

namespace hosted_tee::remote {
namespace {

using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing_support::bytes;

// Version 1, kind 3, 2 bytes of body, sequence 0x01020304.
const bytes sample = {'K', 'T', 'E', 'E', 1, 0, 3, 0, 2, 0, 0, 0, 4, 3, 2, 1, 0xAA, 0xBB};

TEST(FrameTest, AFrameIsTheHeaderOfTheDescriptionAndItsBody) {
  bytes room(64);
  frame_builder builder(room, 3, 0x01020304);
  builder.body().number(std::uint16_t{0xBBAA});
  EXPECT_THAT(builder.finish(), ElementsAreArray(sample));
}

TEST(FrameTest, AFrameIsReadBack) {
  frame read;
  ASSERT_TRUE(read_frame(sample, read));
  EXPECT_EQ(read.header.version, 1);
  EXPECT_EQ(read.header.kind, 3);
  EXPECT_EQ(read.header.sequence, 0x01020304U);
  EXPECT_THAT(read.body, ElementsAre(0xAA, 0xBB));
}

TEST(FrameTest, EveryCutFrameIsRefused) {
  for (std::size_t size = 0; size < sample.size(); ++size) {
    frame read;
    EXPECT_FALSE(read_frame({sample.data(), size}, read)) << size;
  }
}

TEST(FrameTest, ALengthThatIsNotTheBodysIsRefused) {
  for (const std::uint8_t length : bytes{0, 1, 3, 255}) {
    bytes wrong = sample;
    wrong[8] = length;
    frame read;
    EXPECT_FALSE(read_frame(wrong, read)) << int{length};
  }
  bytes huge = sample;
  huge[11] = 0xFF;
  frame read;
  EXPECT_FALSE(read_frame(huge, read));
}

TEST(FrameTest, AnotherFamilyIsRefusedAndAnotherVersionIsTold) {
  frame read;
  for (std::size_t i = 0; i < 4; ++i) {
    bytes other = sample;
    other[i] ^= 1;
    EXPECT_FALSE(read_frame(other, read)) << i;
  }
  bytes newer = sample;
  newer[4] = 2;
  ASSERT_TRUE(read_frame(newer, read));
  EXPECT_EQ(read.header.version, 2);
}

TEST(FrameTest, WhatDoesNotFitGivesNoFrame) {
  bytes room(sample.size() - 1);
  frame_builder builder(room, 3, 1);
  builder.body().number(std::uint16_t{1});
  EXPECT_TRUE(builder.finish().empty());
  bytes no_room(header_size - 1);
  EXPECT_TRUE(frame_builder(no_room, 3, 1).finish().empty());
}

TEST(FrameTest, AWriterThatHasFailedWritesNothingMore) {
  bytes room(4, 0x55);
  frame_writer out(room);
  out.number(std::uint64_t{1});
  out.number(std::uint8_t{1});
  EXPECT_FALSE(out.ok());
  EXPECT_EQ(out.size(), 0U);
  EXPECT_THAT(room, ElementsAre(0x55, 0x55, 0x55, 0x55));
}

TEST(FrameTest, AReaderThatFindsTooLittleStaysWhereItIs) {
  const bytes three = {1, 2, 3};
  frame_reader in(three);
  std::uint32_t number = 7;
  EXPECT_FALSE(in.number(number));
  EXPECT_EQ(number, 7U);
  std::span<const std::uint8_t> view;
  EXPECT_FALSE(in.bytes(SIZE_MAX, view));
  std::uint16_t two = 0;
  EXPECT_TRUE(in.number(two));
  EXPECT_EQ(two, 0x0201);
  EXPECT_FALSE(in.at_end());
}

}  // namespace
}  // namespace hosted_tee::remote
