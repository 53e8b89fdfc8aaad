// The decoder: each refusal with its line, and the one form of a signature that it takes.
#include "tests/ec/der_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class SignatureDecodeTest : public DerTest {
 protected:
  void expect_refused(const char* line, const char* hex, std::size_t half = 32) {
    SCOPED_TRACE(hex);
    const decoded got = decode(from_hex(hex), half);
    EXPECT_EQ(got.result, TEE_ERROR_GENERIC);
    EXPECT_EQ(got.lines, (std::vector<std::string>{line}));
  }

  void expect_numbers(const bytes& r, const bytes& s, const bytes& der) {
    const decoded got = decode(der, r.size());
    EXPECT_EQ(got, (decoded{TEE_SUCCESS, {}, r, s})) << to_hex(der);
  }
};

TEST_F(SignatureDecodeTest, NumbersStandAtTheEndOfTheirHalvesBehindZeros) {
  expect_numbers(from_hex("00000005"), from_hex("00008001"), from_hex("30080201050203008001"));
  expect_numbers(from_hex("80000000"), from_hex("7fffffff"), from_hex("300d0205008000000002047fffffff"));
}

TEST_F(SignatureDecodeTest, ZeroHasNoBytes) {
  expect_numbers(bytes(4), bytes(4), from_hex("300402000200"));
  expect_numbers(bytes(4), from_hex("00000001"), from_hex("30050200020101"));
  expect_refused("Encoding size mismatch", "3006020100020101");
}

TEST_F(SignatureDecodeTest, OneByteIsNoSignature) {
  expect_refused("Wrong der length\n", "");
  expect_refused("Wrong der length\n", "30");
  expect_refused("Wrong der length\n", "00");
}

TEST_F(SignatureDecodeTest, ASignatureIsASequenceOfTwoIntegers) {
  expect_refused("Wrong tag, expect 0x30, got 0x31", "3106020101020101");
  expect_refused("Wrong tag, expect 0x30, got 0x02", "0201");
  expect_refused("Wrong tag, expect 0x02, got 0x03", "3006030101020101");
  expect_refused("Wrong tag, expect 0x02, got 0x30", "3006020101300101");
}

TEST_F(SignatureDecodeTest, TheSequenceFillsTheInputExactly) {
  expect_refused("Wrong length of sequence, expect 6B, got 5B", "3005020101020101");
  expect_refused("Wrong length of sequence, expect 6B, got 7B", "3007020101020101");
  expect_refused("Wrong length of sequence, expect 7B, got 6B", "300602010102010100");
  expect_refused("Wrong length of sequence, expect 6B, got 0B", "3080020101020101");
  expect_refused("Wrong length of sequence, expect 0B, got -1B", "3084ffffffff");
  expect_refused("Wrong length of sequence, expect 1B, got -2147483648B", "30848000000000");
}

TEST_F(SignatureDecodeTest, BytesBehindSAreNoPartOfTheOnlyForm) {
  expect_refused("Encoding size mismatch", "300702010102010100");
  expect_refused("Encoding size mismatch", "3009020101020101020101");
}

TEST_F(SignatureDecodeTest, ALengthMustBeThere) {
  for (const char* const hex : {"3085", "30850000000006020101020101", "30ff", "3081", "308206", "3000", "3003020101",
                                "300102", "30020281", "30050201010284", "300402010102"}) {
    expect_refused("Decode length failed", hex);
  }
}

TEST_F(SignatureDecodeTest, AnIntegerStaysInsideTheSequence) {
  expect_refused("Wrong length of integer, 0B available, got 1B", "30020201");
  expect_refused("Wrong length of integer, 4B available, got 5B", "3006020501020101");
  expect_refused("Wrong length of integer, 1B available, got 2B", "3006020101020201");
  expect_refused("Wrong length of integer, 0B available, got -1B", "30060284ffffffff");
  expect_refused("Wrong length of integer, 0B available, got 127B", "3005020101027f");
}

TEST_F(SignatureDecodeTest, ANumberMustFitItsHalf) {
  expect_refused("Wrong length of R, expect max 1B, got 2B", "300702020101020101", 1);
  expect_refused("Wrong length of S, expect max 1B, got 2B", "300702010102020101", 1);
  expect_refused("Wrong length of R, expect max 1B, got 2B", "30080202010102020101", 1);
  expect_refused("Wrong length of R, expect max 1B, got 2B", "30080203008000020101", 1);  // the sign byte is extra
}

TEST_F(SignatureDecodeTest, RWith33SignificantBytesIsTooLongForP256) {
  const bytes der = join({from_hex("30260221"), bytes(33, 0x11), from_hex("020101")});
  const decoded got = decode(der, 32);
  EXPECT_EQ(got.result, TEE_ERROR_GENERIC);
  EXPECT_EQ(got.lines, (std::vector<std::string>{"Wrong length of R, expect max 32B, got 33B"}));
}

TEST_F(SignatureDecodeTest, OneZeroInFrontIsDroppedAndOnlyWhereTheSignNeedsItKept) {
  expect_numbers(from_hex("80"), from_hex("01"), from_hex("300702020080020101"));
  expect_refused("Encoding size mismatch", "300702020001020101");    // needless
  expect_refused("Encoding size mismatch", "3006020180020101");      // missing
  expect_refused("Encoding size mismatch", "30080203000080020101");  // one too many
  expect_refused("Wrong length of R, expect max 1B, got 2B", "30080203000080020101", 1);
}

TEST_F(SignatureDecodeTest, ALongFormWhereTheShortOneWouldDoIsRefused) {
  expect_refused("Encoding size mismatch", "308106020101020101");
  expect_refused("Encoding size mismatch", "30820006020101020101");
  expect_refused("Encoding size mismatch", "300702810101020101");
  expect_refused("Encoding size mismatch", "300702010102810101");
}

TEST_F(SignatureDecodeTest, AnotherFormOfTheSameSizeIsRefused) {
  // r without its sign byte and s with one too many.
  expect_refused("Encoding mismatch", "300702018002020001");
}

TEST_F(SignatureDecodeTest, ASequenceOf127BytesCannotBeCheckedAndIsRefused) {
  const bytes numbers = join({from_hex("023d"), bytes(61, 0x11), from_hex("023e"), bytes(62, 0x22)});
  for (const bytes& head : {from_hex("307f"), from_hex("30817f")}) {
    const decoded got = decode(join({head, numbers}), 66);
    EXPECT_EQ(got.result, TEE_ERROR_OUT_OF_MEMORY);
    EXPECT_EQ(got.lines, (std::vector<std::string>{"Unfilled buffer, size calculation error", "Out of memory"}));
  }
}

TEST_F(SignatureDecodeTest, WithoutMemoryTheFormCannotBeChecked) {
  ta.faults().fail_allocation(1);
  const decoded got = decode(from_hex("3006020101020101"), 1);
  EXPECT_EQ(got.result, TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(got.lines, (std::vector<std::string>{"Out of memory", "Out of memory"}));
}

}  // namespace
}  // namespace testing_support
