// Boxes as bytes: what is put in comes out in reverse, what is parsed is checked and kept.
#include "soter/tlv_box.h"

#include <random>

#include "tests/support/ta_scope.h"

using namespace keymaster;

namespace testing_support {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

bytes entry(std::uint16_t tag, const bytes& value, std::optional<std::size_t> length = {}) {
  const std::size_t stated = length.value_or(value.size());
  return join({{static_cast<std::uint8_t>(tag), static_cast<std::uint8_t>(tag >> 8), static_cast<std::uint8_t>(stated),
                static_cast<std::uint8_t>(stated >> 8)},
               value});
}

bytes serialized(const tlv_box* box) {
  const std::uint8_t* const buffer = tlv_box_get_buffer(box);
  return {buffer, buffer + tlv_box_get_size(box)};
}

std::optional<bytes> value_of(const tlv_box* box, std::uint16_t tag) {
  const std::uint8_t* value = nullptr;
  std::uint32_t length = 0;
  if (tlv_box_get_bytes_ptr(box, tag, &value, &length) != 0) return std::nullopt;
  return bytes(value, value + length);
}

class TlvBoxTest : public TaUnitTest {
 protected:
  static tlv_box_owner parse(const bytes& data) {
    return tlv_box_owner{tlv_box_parse(data.data(), static_cast<std::uint32_t>(data.size()))};
  }
};

TEST_F(TlvBoxTest, EntriesComeOutInReverseOrder) {
  const tlv_box_owner box{tlv_box_create()};
  ASSERT_TRUE(box);
  EXPECT_EQ(tlv_box_putobject(box.get(), 1, "a", 1), 0);
  EXPECT_EQ(tlv_box_putobject(box.get(), 2, "bc", 2), 0);
  EXPECT_EQ(tlv_box_putobject(box.get(), 0x1234, "def", 3), 0);
  EXPECT_EQ(tlv_box_get_size(box.get()), 3 * 4 + 6U);
  EXPECT_EQ(tlv_box_get_buffer(box.get()), nullptr);
  ASSERT_EQ(tlv_box_serialize(box.get()), 0);
  EXPECT_EQ(to_hex(serialized(box.get())),
            "34120300646566"
            "020002006263"
            "0100010061");
}

TEST_F(TlvBoxTest, AnEmptyBoxSerializesToNothing) {
  const tlv_box_owner box{tlv_box_create()};
  ASSERT_TRUE(box);
  ASSERT_EQ(tlv_box_serialize(box.get()), 0);
  EXPECT_EQ(tlv_box_get_size(box.get()), 0U);
  EXPECT_NE(tlv_box_get_buffer(box.get()), nullptr);
  EXPECT_EQ(tlv_box_putobject(box.get(), 1, "a", 1), -1);
  EXPECT_EQ(tlv_box_serialize(box.get()), -1);
}

TEST_F(TlvBoxTest, ASecondPutOfATagChangesNothing) {
  const tlv_box_owner box{tlv_box_create()};
  ASSERT_EQ(tlv_box_putobject(box.get(), 5, "first", 5), 0);
  const auto before = ta.holdings();
  EXPECT_EQ(tlv_box_putobject(box.get(), 5, "second", 6), -1);
  EXPECT_EQ(tlv_box_get_size(box.get()), 9U);
  EXPECT_EQ(value_of(box.get(), 5), from_text("first"));
  expect_same(ta.holdings(), before);
}

TEST_F(TlvBoxTest, ASerializedBoxIsFrozen) {
  const tlv_box_owner box{tlv_box_create()};
  ASSERT_EQ(tlv_box_putobject(box.get(), 5, "x", 1), 0);
  ASSERT_EQ(tlv_box_serialize(box.get()), 0);
  const bytes form = serialized(box.get());
  EXPECT_EQ(tlv_box_putobject(box.get(), 6, "y", 1), -1);
  EXPECT_EQ(tlv_box_serialize(box.get()), -1);
  EXPECT_EQ(serialized(box.get()), form);
  EXPECT_EQ(value_of(box.get(), 5), from_text("x"));
}

TEST_F(TlvBoxTest, AValueHasAtMost65535Bytes) {
  const tlv_box_owner box{tlv_box_create()};
  const bytes longest = pattern(65535), longer = pattern(65536);
  EXPECT_EQ(tlv_box_putobject(box.get(), 1, longer.data(), 65536), -1);
  EXPECT_EQ(tlv_box_putobject(box.get(), 1, longest.data(), 0xFFFFFFFF), -1);
  EXPECT_EQ(tlv_box_putobject(box.get(), 1, nullptr, 1), -1);
  EXPECT_EQ(tlv_box_get_size(box.get()), 0U);
  EXPECT_EQ(tlv_box_putobject(box.get(), 1, longest.data(), 65535), 0);
  EXPECT_EQ(tlv_box_putobject(box.get(), 2, nullptr, 0), 0);
  ASSERT_EQ(tlv_box_serialize(box.get()), 0);
  EXPECT_EQ(serialized(box.get()), join({entry(2, {}), entry(1, longest)}));
}

TEST_F(TlvBoxTest, WhatIsParsedIsFoundAndFrozen) {
  const bytes data = join({entry(0x1835, from_text("sensor")), entry(17, pattern(256)), entry(3, {})});
  const tlv_box_owner box = parse(data);
  ASSERT_TRUE(box);
  EXPECT_EQ(value_of(box.get(), 0x1835), from_text("sensor"));
  EXPECT_EQ(value_of(box.get(), 17), pattern(256));
  EXPECT_EQ(value_of(box.get(), 3), bytes());
  EXPECT_EQ(value_of(box.get(), 4), std::nullopt);
  EXPECT_EQ(serialized(box.get()), data);
  EXPECT_EQ(tlv_box_putobject(box.get(), 4, "y", 1), -1);
  EXPECT_EQ(tlv_box_serialize(box.get()), -1);
}

TEST_F(TlvBoxTest, NothingParsesToAnEmptyFrozenBox) {
  const std::uint8_t byte = 0;
  for (const std::uint8_t* const buffer : {static_cast<const std::uint8_t*>(nullptr), &byte}) {
    const tlv_box_owner box{tlv_box_parse(buffer, 0)};
    ASSERT_TRUE(box);
    EXPECT_EQ(tlv_box_get_size(box.get()), 0U);
    EXPECT_NE(tlv_box_get_buffer(box.get()), nullptr);
    EXPECT_EQ(tlv_box_putobject(box.get(), 4, "y", 1), -1);
    EXPECT_EQ(tlv_box_serialize(box.get()), -1);
  }
  EXPECT_EQ(tlv_box_parse(nullptr, 1), nullptr);
}

TEST_F(TlvBoxTest, OfARepeatedTagTheFirstValueStaysAndTheSizeIsTheInputs) {
  const bytes data = join({entry(9, from_text("first")), entry(9, from_text("second")), entry(10, {1})});
  const tlv_box_owner box = parse(data);
  ASSERT_TRUE(box);
  EXPECT_EQ(value_of(box.get(), 9), from_text("first"));
  EXPECT_EQ(value_of(box.get(), 10), bytes{1});
  EXPECT_EQ(serialized(box.get()), data);
}

TEST_F(TlvBoxTest, EveryCutInsideAnEntryIsRefused) {
  const bytes first = entry(1, pattern(5)), second = entry(2, {}), third = entry(3, pattern(9));
  const bytes data = join({first, second, third});
  const std::vector<std::size_t> whole = {0, first.size(), first.size() + second.size(), data.size()};
  for (std::size_t size = 0; size <= data.size(); ++size) {
    const bytes cut(data.begin(), data.begin() + static_cast<std::ptrdiff_t>(size));
    const bool fits = std::find(whole.begin(), whole.end(), size) != whole.end();
    EXPECT_EQ(static_cast<bool>(parse(cut)), fits) << size;
    expect_same(ta.holdings(), {});
  }
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(TlvBoxTest, AValueThatIsLongerThanTheRestIsRefused) {
  for (const std::size_t stated : {6U, 7U, 255U, 256U, 65535U}) {
    EXPECT_FALSE(parse(entry(1, pattern(5), stated))) << stated;
  }
  EXPECT_TRUE(parse(entry(1, pattern(5), 5)));
}

TEST_F(TlvBoxTest, RandomBytesAreReadAsAnIndependentReaderDoes) {
  std::mt19937 random(71);
  int accepted = 0;
  for (int round = 0; round < 20'000; ++round) {
    bytes data(random() % 40);
    // Small numbers, so that many entries fit.
    for (std::uint8_t& byte : data) byte = static_cast<std::uint8_t>(random() % 4 == 0 ? random() % 6 : 0);
    std::map<std::uint16_t, bytes> expected;
    std::size_t at = 0;
    bool fits = true;
    while (fits && at < data.size()) {
      fits = data.size() - at >= 4;
      if (!fits) break;
      const std::size_t length = data[at + 2] + 256U * data[at + 3];
      const auto tag = static_cast<std::uint16_t>(data[at] + 256 * data[at + 1]);
      at += 4;
      fits = data.size() - at >= length;
      if (!fits) break;
      const auto from = data.begin() + static_cast<std::ptrdiff_t>(at);
      expected.emplace(tag, bytes(from, from + static_cast<std::ptrdiff_t>(length)));
      at += length;
    }
    const tlv_box_owner box = parse(data);
    ASSERT_EQ(static_cast<bool>(box), fits) << to_hex(data);
    if (!box) continue;
    ++accepted;
    ASSERT_EQ(serialized(box.get()), data);
    ASSERT_EQ(box.get()->entries->count, expected.size());
    for (const auto& [tag, value] : expected) ASSERT_EQ(value_of(box.get(), tag), value);
  }
  EXPECT_GT(accepted, 1000);
}

TEST_F(TlvBoxTest, WantOfMemoryIsTracedWithWhatWasNeeded) {
  const bytes data = entry(1, pattern(100));
  for (const auto& [allocation, line] : std::map<unsigned, std::string>{
           {1, "Out of memory, need 12B"}, {2, "Out of memory, need 12B"}, {3, "Out of memory, need 104B"}}) {
    ta.clear_trace();
    ta.faults().clear();
    ta.faults().fail_allocation(allocation);
    EXPECT_FALSE(parse(data));
    EXPECT_THAT(ta.errors(), ElementsAre(line));
    expect_same(ta.holdings(), {});
  }
  // An entry that finds no memory is left out.
  for (const auto& [allocation, line] : std::map<unsigned, std::string>{
           {4, "Out of memory, need 8B"}, {5, "Out of memory, need 100B"}, {6, "Out of memory, need 16B"}}) {
    ta.clear_trace();
    ta.faults().clear();
    ta.faults().fail_allocation(allocation);
    const tlv_box_owner box = parse(data);
    ASSERT_TRUE(box);
    EXPECT_EQ(value_of(box.get(), 1), std::nullopt);
    EXPECT_EQ(serialized(box.get()), data);
    EXPECT_THAT(ta.errors(), ElementsAre(line));
  }
}

TEST_F(TlvBoxTest, WithoutMemoryToSerializeTheBoxStaysOpen) {
  const tlv_box_owner box{tlv_box_create()};
  ASSERT_EQ(tlv_box_putobject(box.get(), 1, "abc", 3), 0);
  ta.faults().fail_allocation(1);
  EXPECT_EQ(tlv_box_serialize(box.get()), -1);
  EXPECT_THAT(ta.errors(), ElementsAre("Out of memory, need 7B"));
  EXPECT_EQ(tlv_box_get_buffer(box.get()), nullptr);
  EXPECT_EQ(tlv_box_putobject(box.get(), 2, "d", 1), 0);
  EXPECT_EQ(tlv_box_serialize(box.get()), 0);
}

TEST_F(TlvBoxTest, ABoxIsWipedWhenItGoes) {
  const bytes secret = pattern(64);
  bool left = false;
  int blocks = 0;
  ta.on_free([&](std::span<const std::uint8_t> block) {
    ++blocks;
    left = left || contains(block, std::span(secret).first(16));
  });
  parse(entry(1, secret));
  EXPECT_GE(blocks, 5);
  EXPECT_FALSE(left);
}

}  // namespace
}  // namespace testing_support
