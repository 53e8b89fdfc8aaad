// The slot by itself: what one side leaves behind in it, and what the other makes of whatever lies there.
#include <gmock/gmock.h>

#include <array>
#include <thread>

#include "tee/socket/frame_slot.h"
#include "tests/support/bytes.h"

namespace hosted_tee {
namespace {

using ::testing_support::bytes;
using handed = frame_slot::handed;

class FrameSlotTest : public ::testing::Test {
 protected:
  static constexpr std::size_t longest = 64;

  [[nodiscard]] std::uint32_t word() const {
    std::uint32_t value = 0;
    std::copy_n(memory.begin(), sizeof value, reinterpret_cast<std::uint8_t*>(&value));
    return value;
  }
  void set_word(std::uint32_t value) {
    std::copy_n(reinterpret_cast<const std::uint8_t*>(&value), sizeof value, memory.begin());
  }

  alignas(std::uint32_t) std::array<std::uint8_t, sizeof(std::uint32_t) + longest> memory{};
  frame_slot slot{memory.data(), std::span(memory).subspan(sizeof(std::uint32_t))};
  bytes room = bytes(longest, 0xA5);
};

TEST_F(FrameSlotTest, AFrameIsTakenAsItWasPutAndTheSlotIsEmptyThen) {
  for (const std::size_t size : {std::size_t{2}, std::size_t{16}, longest}) {
    const bytes frame(size, 0x3C);
    EXPECT_EQ(slot.put(frame), handed::over);
    EXPECT_EQ(word(), size);
    EXPECT_TRUE(slot.watch());
    EXPECT_EQ(slot.take(room), size);
    EXPECT_EQ(bytes(room.begin(), room.begin() + static_cast<std::ptrdiff_t>(size)), frame);
    EXPECT_EQ(word(), 0U);
    EXPECT_FALSE(slot.watch());
  }
}

TEST_F(FrameSlotTest, WhoeverSleepsIsToldOfOnce) {
  EXPECT_TRUE(slot.begin_sleep());
  EXPECT_EQ(word(), 1U);
  EXPECT_EQ(slot.put(bytes(20)), handed::to_sleeper);
  EXPECT_FALSE(slot.end_sleep());
  EXPECT_EQ(slot.take(room), 20U);
  EXPECT_EQ(slot.put(bytes(20)), handed::over);
}

TEST_F(FrameSlotTest, NobodyFallsAsleepBesideAFrame) {
  EXPECT_EQ(slot.put(bytes(20)), handed::over);
  EXPECT_FALSE(slot.begin_sleep());
  EXPECT_EQ(slot.take(room), 20U);
  EXPECT_TRUE(slot.begin_sleep());
  EXPECT_TRUE(slot.end_sleep());
  EXPECT_EQ(word(), 0U);
}

TEST_F(FrameSlotTest, WordsThatAreNoLengthGiveNothing) {
  for (const std::uint32_t value : {0U, 1U, std::uint32_t{longest} + 1, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFFFU}) {
    set_word(value);
    EXPECT_FALSE(slot.take(room)) << value;
    EXPECT_EQ(room, bytes(longest, 0xA5));
  }
}

TEST_F(FrameSlotTest, AFrameThatIsLongerThanTheTakersRoomIsNotTaken) {
  EXPECT_EQ(slot.put(bytes(20)), handed::over);
  EXPECT_FALSE(slot.take(std::span(room).first(19)));
  EXPECT_EQ(room, bytes(longest, 0xA5));
}

TEST_F(FrameSlotTest, WordsThatNoTakerLeavesAreNoticed) {
  for (const std::uint32_t value : {2U, 20U, 0xFFFFFFFFU}) {
    set_word(value);
    EXPECT_EQ(slot.put(bytes(20)), handed::in_vain) << value;
  }
}

TEST_F(FrameSlotTest, AFrameThatDoesNotFitIsNotPut) {
  for (const std::size_t size : {std::size_t{0}, std::size_t{1}, longest + 1}) {
    EXPECT_EQ(slot.put(bytes(size, 0x3C)), handed::in_vain) << size;
  }
  EXPECT_TRUE(std::all_of(memory.begin(), memory.end(), [](std::uint8_t byte) { return byte == 0; }));
}

// In one memory, so that the thread sanitizer sees what orders the bytes.
TEST_F(FrameSlotTest, FramesOfAnotherThreadComeWholeAndInOrder) {
  constexpr int frames = 20'000;
  alignas(std::uint32_t) std::array<std::uint8_t, sizeof(std::uint32_t) + longest> back{};
  frame_slot answers(back.data(), std::span(back).subspan(sizeof(std::uint32_t)));
  std::thread echo([&] {
    bytes taken(longest);
    for (int i = 0; i < frames; ++i) {
      while (!slot.watch()) std::this_thread::yield();
      const auto size = slot.take(taken);
      ASSERT_TRUE(size);
      ASSERT_EQ(answers.put(std::span(taken).first(*size)), handed::over);
    }
  });
  for (int i = 0; i < frames; ++i) {
    const bytes frame(2 + static_cast<std::size_t>(i) % (longest - 2), static_cast<std::uint8_t>(i));
    ASSERT_EQ(slot.put(frame), handed::over);
    while (!answers.watch()) std::this_thread::yield();
    ASSERT_EQ(answers.take(room), frame.size());
    ASSERT_TRUE(std::equal(frame.begin(), frame.end(), room.begin()));
  }
  echo.join();
}

}  // namespace
}  // namespace hosted_tee
