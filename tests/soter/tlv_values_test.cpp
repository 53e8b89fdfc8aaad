// What goes into a box by type, and comes out by width.
#include <optional>

#include "soter/tlv_box.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;

namespace testing_support {
namespace {

class TlvValuesTest : public TaUnitTest {
 protected:
  void TearDown() override {
    box.reset();
    TaUnitTest::TearDown();
  }
  [[nodiscard]] std::optional<std::string> stored(std::uint16_t tag) const {
    const std::uint8_t* value = nullptr;
    std::uint32_t length = 0;
    if (tlv_box_get_bytes_ptr(box.get(), tag, &value, &length) != 0) return std::nullopt;
    return to_hex({value, length});
  }

  tlv_box_owner box{tlv_box_create()};
};

TEST_F(TlvValuesTest, NumbersAreStoredLittleEndianInTheirWidth) {
  EXPECT_EQ(tlv_box_put_char(box.get(), 1, -2), 0);
  EXPECT_EQ(tlv_box_put_short(box.get(), 2, 0x1234), 0);
  EXPECT_EQ(tlv_box_put_int(box.get(), 3, -2), 0);
  EXPECT_EQ(tlv_box_put_long(box.get(), 4, 0x01020304), 0);
  EXPECT_EQ(tlv_box_put_longlong(box.get(), 5, 0x0102030405060708), 0);
  EXPECT_EQ(tlv_box_put_float(box.get(), 6, 1.5F), 0);
  EXPECT_EQ(tlv_box_put_double(box.get(), 7, -2.0), 0);
  EXPECT_EQ(stored(1), "fe");
  EXPECT_EQ(stored(2), "3412");
  EXPECT_EQ(stored(3), "feffffff");
  EXPECT_EQ(stored(4), "04030201");
  EXPECT_EQ(stored(5), "0807060504030201");
  EXPECT_EQ(stored(6), "0000c03f");
  EXPECT_EQ(stored(7), "00000000000000c0");
}

TEST_F(TlvValuesTest, NumbersComeOutAsTheyWentIn) {
  ASSERT_EQ(tlv_box_put_char(box.get(), 1, -128), 0);
  ASSERT_EQ(tlv_box_put_short(box.get(), 2, -32768), 0);
  ASSERT_EQ(tlv_box_put_int(box.get(), 3, -2147483647), 0);
  ASSERT_EQ(tlv_box_put_long(box.get(), 4, 2147483647), 0);
  ASSERT_EQ(tlv_box_put_longlong(box.get(), 5, -9), 0);
  ASSERT_EQ(tlv_box_put_float(box.get(), 6, 0.1F), 0);
  ASSERT_EQ(tlv_box_put_double(box.get(), 7, 0.1), 0);
  std::int8_t c = 0;
  std::int16_t s = 0;
  std::int32_t i = 0, l = 0;
  std::int64_t ll = 0;
  float f = 0;
  double d = 0;
  EXPECT_EQ(tlv_box_get_char(box.get(), 1, &c), 0);
  EXPECT_EQ(tlv_box_get_short(box.get(), 2, &s), 0);
  EXPECT_EQ(tlv_box_get_int(box.get(), 3, &i), 0);
  EXPECT_EQ(tlv_box_get_long(box.get(), 4, &l), 0);
  EXPECT_EQ(tlv_box_get_longlong(box.get(), 5, &ll), 0);
  EXPECT_EQ(tlv_box_get_float(box.get(), 6, &f), 0);
  EXPECT_EQ(tlv_box_get_double(box.get(), 7, &d), 0);
  EXPECT_EQ(c, -128);
  EXPECT_EQ(s, -32768);
  EXPECT_EQ(i, -2147483647);
  EXPECT_EQ(l, 2147483647);
  EXPECT_EQ(ll, -9);
  EXPECT_EQ(f, 0.1F);
  EXPECT_EQ(d, 0.1);
}

TEST_F(TlvValuesTest, ANumberIsReadInItsWidthWhateverTheValuesLength) {
  ASSERT_EQ(tlv_box_put_short(box.get(), 1, 0x1234), 0);
  ASSERT_EQ(tlv_box_put_bytes(box.get(), 2, "\1\2\3\4\5\6\7\10\11", 9), 0);
  ASSERT_EQ(tlv_box_put_bytes(box.get(), 3, nullptr, 0), 0);
  std::int32_t number = -1;
  EXPECT_EQ(tlv_box_get_int(box.get(), 1, &number), 0);
  EXPECT_EQ(number, 0x1234);
  std::int64_t wide = -1;
  EXPECT_EQ(tlv_box_get_longlong(box.get(), 1, &wide), 0);
  EXPECT_EQ(wide, 0x1234);
  EXPECT_EQ(tlv_box_get_longlong(box.get(), 2, &wide), 0);
  EXPECT_EQ(wide, 0x0807060504030201);
  EXPECT_EQ(tlv_box_get_longlong(box.get(), 3, &wide), 0);
  EXPECT_EQ(wide, 0);
}

TEST_F(TlvValuesTest, AnAbsentTagLeavesTheTargetAlone) {
  std::int8_t c = 7;
  std::int16_t s = 7;
  std::int32_t i = 7, l = 7;
  std::int64_t ll = 7;
  float f = 7;
  double d = 7;
  EXPECT_EQ(tlv_box_get_char(box.get(), 1, &c), -1);
  EXPECT_EQ(tlv_box_get_short(box.get(), 1, &s), -1);
  EXPECT_EQ(tlv_box_get_int(box.get(), 1, &i), -1);
  EXPECT_EQ(tlv_box_get_long(box.get(), 1, &l), -1);
  EXPECT_EQ(tlv_box_get_longlong(box.get(), 1, &ll), -1);
  EXPECT_EQ(tlv_box_get_float(box.get(), 1, &f), -1);
  EXPECT_EQ(tlv_box_get_double(box.get(), 1, &d), -1);
  EXPECT_EQ(c + s + i + l + static_cast<int>(ll), 35);
  EXPECT_EQ(f + d, 14.0);
  std::uint32_t length = 7;
  char text = 'x';
  EXPECT_EQ(tlv_box_get_bytes(box.get(), 1, &text, &length), -1);
  EXPECT_EQ(tlv_box_get_string(box.get(), 1, &text, &length), -1);
  EXPECT_EQ(length, 7U);
  EXPECT_EQ(text, 'x');
  const std::uint8_t* value = nullptr;
  EXPECT_EQ(tlv_box_get_bytes_ptr(box.get(), 1, &value, &length), -1);
  EXPECT_EQ(value, nullptr);
}

TEST_F(TlvValuesTest, AStringIsStoredWithItsNul) {
  EXPECT_EQ(tlv_box_put_string(box.get(), 1, "ab"), 0);
  EXPECT_EQ(tlv_box_put_string(box.get(), 2, ""), 0);
  EXPECT_EQ(tlv_box_put_string(box.get(), 3, nullptr), -1);
  EXPECT_EQ(stored(1), "616200");
  EXPECT_EQ(stored(2), "00");
  EXPECT_EQ(stored(3), std::nullopt);
  EXPECT_EQ(tlv_box_get_size(box.get()), 4 + 3 + 4 + 1U);
}

TEST_F(TlvValuesTest, AStringHasAtMost65534Characters) {
  EXPECT_EQ(tlv_box_put_string(box.get(), 1, std::string(65535, 'x').c_str()), -1);
  EXPECT_EQ(tlv_box_put_string(box.get(), 1, std::string(65534, 'x').c_str()), 0);
  EXPECT_EQ(tlv_box_get_size(box.get()), 4 + 65535U);
}

TEST_F(TlvValuesTest, BytesFillTheRoomWithZerosBehindThem) {
  ASSERT_EQ(tlv_box_put_bytes(box.get(), 1, "abcdefghij", 10), 0);
  bytes room(12, 0xEE);
  std::uint32_t length = 11;
  EXPECT_EQ(tlv_box_get_bytes(box.get(), 1, room.data(), &length), 0);
  EXPECT_EQ(length, 10U);
  EXPECT_EQ(room, join({from_text("abcdefghij"), {0, 0xEE}}));
  length = 9;
  room.assign(12, 0xEE);
  EXPECT_EQ(tlv_box_get_bytes(box.get(), 1, room.data(), &length), -1);
  EXPECT_EQ(length, 9U);
  EXPECT_EQ(room, bytes(12, 0xEE));
  length = 10;
  EXPECT_EQ(tlv_box_get_bytes(box.get(), 1, room.data(), &length), 0);
  EXPECT_EQ(room, join({from_text("abcdefghij"), {0xEE, 0xEE}}));
}

TEST_F(TlvValuesTest, AStringComesOutAsItWasStored) {
  ASSERT_EQ(tlv_box_put_string(box.get(), 1, "ab"), 0);
  ASSERT_EQ(tlv_box_put_bytes(box.get(), 2, "cd", 2), 0);
  std::string room = "......";
  std::uint32_t length = 5;
  EXPECT_EQ(tlv_box_get_string(box.get(), 1, room.data(), &length), 0);
  EXPECT_EQ(length, 3U);
  EXPECT_EQ(room, std::string("ab\0\0\0.", 6));
  room = "......";
  length = 2;
  EXPECT_EQ(tlv_box_get_string(box.get(), 2, room.data(), &length), 0);
  EXPECT_EQ(room, "cd....");  // no NUL of its own
}

TEST_F(TlvValuesTest, BoxesNest) {
  const tlv_box_owner inner{tlv_box_create()};
  ASSERT_EQ(tlv_box_put_int(inner.get(), 7, 77), 0);
  EXPECT_EQ(tlv_box_put_object(box.get(), 1, inner.get()), -1);  // not serialized yet
  EXPECT_EQ(tlv_box_put_object(box.get(), 1, nullptr), -1);
  ASSERT_EQ(tlv_box_serialize(inner.get()), 0);
  EXPECT_EQ(tlv_box_put_object(box.get(), 1, inner.get()), 0);
  EXPECT_EQ(stored(1), "070004004d000000");
  tlv_box* out = nullptr;
  EXPECT_EQ(tlv_box_get_object(box.get(), 1, &out), 0);
  const tlv_box_owner found{out};
  std::int32_t number = 0;
  EXPECT_EQ(tlv_box_get_int(found.get(), 7, &number), 0);
  EXPECT_EQ(number, 77);
}

TEST_F(TlvValuesTest, AValueThatIsNoBoxIsNoObject) {
  ASSERT_EQ(tlv_box_put_short(box.get(), 1, 5), 0);
  for (const std::uint16_t tag : {std::uint16_t{1}, std::uint16_t{2}}) {
    tlv_box* out = box.get();
    EXPECT_EQ(tlv_box_get_object(box.get(), tag, &out), -1);
    EXPECT_EQ(out, nullptr);
  }
}

TEST_F(TlvValuesTest, ABoxOfMoreThan65535BytesIsNoValue) {
  const tlv_box_owner large{tlv_box_create()};
  const bytes half = pattern(32764);
  ASSERT_EQ(tlv_box_put_bytes(large.get(), 1, half.data(), 32764), 0);
  ASSERT_EQ(tlv_box_put_bytes(large.get(), 2, half.data(), 32764), 0);
  ASSERT_EQ(tlv_box_serialize(large.get()), 0);
  ASSERT_EQ(tlv_box_get_size(large.get()), 65536U);
  EXPECT_EQ(tlv_box_put_object(box.get(), 1, large.get()), -1);
  EXPECT_EQ(stored(1), std::nullopt);
}

}  // namespace
}  // namespace testing_support
