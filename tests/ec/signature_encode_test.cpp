// The encoder, against libcrypto's over numbers of every size, and where it is meant to differ.
#include <fmt/format.h>

#include "tests/ec/der_fixture.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::size_t widest = 66;  // bytes of half a signature on P-521

/// A number of exactly `size` bytes, the first of them as given.
bytes number_of(std::size_t size, std::uint8_t first) {
  bytes number = pattern(size, static_cast<std::uint32_t>(size));
  if (!number.empty()) number.front() = first;
  return number;
}

/// The length of the sequence's content as DER has it.
std::size_t body_size(const bytes& der) {
  return der.at(1) < 0x80 ? der.at(1) : der.at(2);
}

class SignatureEncodeTest : public DerTest {};

TEST_F(SignatureEncodeTest, NumbersOfAllSizesAreEncodedAsLibcryptoDoes) {
  int refused = 0;
  for (std::size_t r_size = 1; r_size <= widest; ++r_size) {
    for (std::size_t s_size = 1; s_size <= widest; ++s_size) {
      for (const auto& [r_first, s_first] :
           {std::pair<int, int>{0x01, 0x7F}, {0x80, 0x01}, {0x7F, 0xFF}, {0xFF, 0x80}}) {
        const bytes r = number_of(r_size, static_cast<std::uint8_t>(r_first));
        const bytes s = number_of(s_size, static_cast<std::uint8_t>(s_first));
        const bytes expected = der_of(r, s);
        const std::optional<bytes> got = encode(r, s);
        if (body_size(expected) == 127) {
          ASSERT_FALSE(got.has_value());
          ASSERT_EQ(ta.errors(), (std::vector<std::string>{"Unfilled buffer, size calculation error"}));
          ++refused;
        } else {
          ASSERT_TRUE(got.has_value());
          ASSERT_EQ(to_hex(*got), to_hex(expected));
        }
        ASSERT_EQ(got, reference_encode(r, s));
      }
    }
  }
  EXPECT_GT(refused, 0);
}

TEST_F(SignatureEncodeTest, LeadingZerosOfAHalfFallAway) {
  for (std::size_t half = 1; half <= widest; ++half) {
    for (std::size_t zeros = 0; zeros < half; ++zeros) {
      const bytes significant = number_of(half - zeros, zeros % 2 == 0 ? 0x80 : 0x35);
      const bytes padded = join({bytes(zeros), significant});
      ASSERT_EQ(encode(padded, padded), reference_encode(significant, significant));
      ASSERT_EQ(encode(padded, {1}), encode(significant, {1}));
    }
  }
}

TEST_F(SignatureEncodeTest, ANumberWithItsTopBitSetHasASignByte) {
  const bytes r = join({{0x80}, bytes(31, 0x5A)}), s = join({{0x7F}, bytes(31, 0xA5)});
  EXPECT_EQ(to_hex(encode(r, s).value()), "3045022100" + to_hex(r) + "0220" + to_hex(s));
}

TEST_F(SignatureEncodeTest, ZeroIsAnIntegerWithoutBytes) {
  for (const bytes& zero : {bytes{}, bytes(1), bytes(66)}) {
    EXPECT_EQ(to_hex(encode(zero, zero).value()), "300402000200");
    EXPECT_EQ(to_hex(encode(zero, {1}).value()), "30050200020101");
    EXPECT_EQ(to_hex(encode({0xFF}, zero).value()), "3006020200ff0200");
  }
}

TEST_F(SignatureEncodeTest, AroundALengthOf127TheFormGoesFromShortToLong) {
  const bytes r = number_of(61, 1);  // 63 bytes as an element
  EXPECT_EQ(body_size(encode(r, number_of(61, 1)).value()), 126U);
  EXPECT_EQ(to_hex(encode(r, number_of(61, 1)).value()).substr(0, 8), "307e023d");
  EXPECT_FALSE(encode(r, number_of(62, 1)).has_value());
  EXPECT_FALSE(encode(r, number_of(61, 0x80)).has_value());  // the sign byte makes it 62
  EXPECT_EQ(to_hex(encode(r, number_of(63, 1)).value()).substr(0, 8), "30818002");
}

TEST_F(SignatureEncodeTest, AnIntegerOf127BytesCannotBeEncodedEither) {
  EXPECT_TRUE(encode(number_of(126, 1), {1}).has_value());
  EXPECT_FALSE(encode(number_of(127, 1), {1}).has_value());
  EXPECT_EQ(ta.errors(), (std::vector<std::string>{"Unfilled buffer, size calculation error"}));
  EXPECT_FALSE(encode({1}, number_of(126, 0x80)).has_value());
  EXPECT_EQ(encode({1}, number_of(128, 1)), der_of({1}, number_of(128, 1)));
}

TEST_F(SignatureEncodeTest, TwoSuchIntegersStayInsideTheBufferToo) {
  const bytes numbers[] = {number_of(127, 1), number_of(126, 0x80), number_of(127, 0x7F)};
  for (const bytes& r : numbers) {
    for (const bytes& s : numbers) {
      EXPECT_FALSE(encode(r, s).has_value());
      EXPECT_EQ(ta.errors(), (std::vector<std::string>{"Unfilled buffer, size calculation error"}));
    }
  }
}

TEST_F(SignatureEncodeTest, ASequenceOf255BytesHasALengthOfTwoBytes) {
  const auto first_bytes = [&](std::size_t r_size, std::size_t s_size) {
    return to_hex(encode(number_of(r_size, 1), number_of(s_size, 1)).value()).substr(0, 8);
  };
  EXPECT_EQ(first_bytes(125, 125), "3081fe02");  // two elements of 127 bytes
  EXPECT_EQ(first_bytes(126, 125), "308200ff");
  EXPECT_EQ(first_bytes(126, 126), "30820100");
}

TEST_F(SignatureEncodeTest, WithoutMemoryThereIsNoEncoding) {
  ta.faults().fail_allocation(1);
  EXPECT_FALSE(encode({1}, {2}).has_value());
  EXPECT_EQ(ta.errors(), (std::vector<std::string>{"Out of memory"}));
}

}  // namespace
}  // namespace testing_support
