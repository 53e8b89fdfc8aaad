// DER lengths: how they are counted, written and read.
#include <fmt/format.h>

#include <array>

#include "tests/ec/der_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

bytes written(std::uint32_t length) {
  std::array<std::uint8_t, 8> place = {};
  std::uint8_t* position = place.data();
  encode_length(&position, length);
  return {place.data(), position};
}

struct read_length {
  int result = -1;
  std::uint32_t length = 0;
  std::size_t taken = 0;

  bool operator==(const read_length&) const = default;
};

read_length read(const bytes& input) {
  const std::unique_ptr<std::uint8_t[]> exact(new std::uint8_t[input.size()]);
  std::copy(input.begin(), input.end(), exact.get());
  read_length got;
  const std::uint8_t* position = exact.get();
  got.result = der_decode_length(&position, exact.get() + input.size(), &got.length);
  got.taken = static_cast<std::size_t>(position - exact.get());
  return got;
}

class SignatureLengthTest : public DerTest {};

TEST_F(SignatureLengthTest, TheLengthOfALengthGrowsAtOneLessThanAPowerOf256) {
  struct row {
    std::uint32_t length, bytes;
  };
  for (const row& each : {row{0, 1},
                          {126, 1},
                          {127, 1},
                          {128, 1},
                          {254, 1},
                          {255, 2},
                          {256, 2},
                          {65534, 2},
                          {65535, 3},
                          {16777214, 3},
                          {16777215, 4},
                          {16777216, 4},
                          {0xFFFFFFFF, 4}}) {
    EXPECT_EQ(der_length_bytes(each.length), each.bytes) << each.length;
  }
}

TEST_F(SignatureLengthTest, ALengthOf127IsTheFirstInTheLongForm) {
  struct row {
    std::uint32_t length;
    const char* form;
  };
  for (const row& each : {row{0, "00"},
                          {1, "01"},
                          {126, "7e"},
                          {127, "817f"},
                          {128, "8180"},
                          {254, "81fe"},
                          {255, "8200ff"},
                          {256, "820100"},
                          {65534, "82fffe"},
                          {65535, "8300ffff"},
                          {16777214, "83fffffe"},
                          {16777215, "8400ffffff"},
                          {16777216, "8401000000"},
                          {0xFFFFFFFF, "84ffffffff"}}) {
    EXPECT_EQ(to_hex(written(each.length)), each.form);
  }
  EXPECT_TRUE(ta.errors().empty());
}

TEST_F(SignatureLengthTest, EveryLengthUpTo65536IsReadAsItWasWritten) {
  for (std::uint32_t length = 0; length <= 65536; ++length) {
    const bytes form = written(length);
    ASSERT_EQ(form.size(), length <= 126 ? 1 : 1 + der_length_bytes(length));
    ASSERT_EQ(read(form), (read_length{0, length, form.size()}));
    ASSERT_EQ(read(join({form, {0xAA}})), (read_length{0, length, form.size()}));
  }
}

TEST_F(SignatureLengthTest, LengthsOfManyBytesAreReadWhateverTheirLeadingZeros) {
  for (const auto& [form, length] : std::vector<std::pair<const char*, std::uint32_t>>{{"7f", 127},
                                                                                       {"80", 0},
                                                                                       {"8100", 0},
                                                                                       {"817f", 127},
                                                                                       {"820001", 1},
                                                                                       {"83000102", 258},
                                                                                       {"8400000000", 0},
                                                                                       {"84ffffffff", 0xFFFFFFFF}}) {
    const bytes input = from_hex(form);
    EXPECT_EQ(read(input), (read_length{0, length, input.size()})) << form;
  }
}

TEST_F(SignatureLengthTest, ALengthThatEndsTooSoonOrHasMoreThanFourBytesIsRefused) {
  EXPECT_EQ(read({}).result, 1);
  for (unsigned count = 1; count <= 4; ++count) {
    for (std::size_t there = 0; there < count; ++there) {
      EXPECT_EQ(read(join({{static_cast<std::uint8_t>(0x80 + count)}, bytes(there, 1)})).result, 1)
          << count << " bytes, of which there are " << there;
    }
  }
  for (unsigned first = 0x85; first <= 0xFF; ++first) {
    EXPECT_EQ(read(join({{static_cast<std::uint8_t>(first)}, bytes(127, 1)})).result, 1) << first;
  }
}

}  // namespace
}  // namespace testing_support
