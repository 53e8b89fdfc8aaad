// The decoder over whole families of inputs: all short ones, and all that are one byte away from a signature. Each is
// judged by the second decoder, and by libcrypto.
#include <openssl/ecdsa.h>

#include "tests/ec/der_fixture.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// Whether libcrypto reads the input and would write it just so: the DER forms of two numbers.
bool is_der_for_libcrypto(const bytes& der) {
  const unsigned char* at = der.data();
  const std::unique_ptr<ECDSA_SIG, decltype(&ECDSA_SIG_free)> parsed(
      d2i_ECDSA_SIG(nullptr, &at, static_cast<long>(der.size())), ECDSA_SIG_free);
  if (parsed == nullptr) return false;
  unsigned char* written = nullptr;
  const int length = i2d_ECDSA_SIG(parsed.get(), &written);
  const bytes canonical(written, written + length);
  OPENSSL_free(written);
  return canonical == der;
}

bool is_zero(const bytes& number) {
  return std::all_of(number.begin(), number.end(), [](std::uint8_t byte) { return byte == 0; });
}

class SignatureSweepTest : public DerTest {
 protected:
  /// check decodes; libcrypto must agree on what is accepted but for zero, which it writes with a byte.
  void check(const bytes& der, std::size_t half) {
    const decoded got = decode(der, half);
    ASSERT_EQ(got, reference_decode(der, half)) << to_hex(der);
    const bool accepted = got.result == TEE_SUCCESS;
    accepted_ += accepted ? 1 : 0;
    if (accepted && !is_zero(got.r) && !is_zero(got.s)) {
      ASSERT_TRUE(is_der_for_libcrypto(der)) << to_hex(der);
    }
  }

  /// every_string checks all strings of `size` bytes over an alphabet that begin with `head`.
  void every_string(const bytes& head, const bytes& alphabet, std::size_t size, std::size_t half) {
    std::vector<std::size_t> digits(size - head.size());
    bytes der = head;
    der.resize(size, alphabet.front());
    for (;;) {
      ASSERT_NO_FATAL_FAILURE(check(der, half));
      std::size_t at = size;
      while (at > head.size() && digits[at - head.size() - 1] + 1 == alphabet.size()) {
        --at;
        digits[at - head.size()] = 0;
        der[at] = alphabet.front();
      }
      if (at == head.size()) return;
      --at;
      der[at] = alphabet.at(++digits[at - head.size()]);
    }
  }

  int accepted_ = 0;
};

bytes all_bytes() {
  bytes all(256);
  for (std::size_t i = 0; i < all.size(); ++i) all[i] = static_cast<std::uint8_t>(i);
  return all;
}

TEST_F(SignatureSweepTest, NoInputOfUpToTwoBytesAndNoTellingOneOfThreeOrFourIsASignature) {
  const bytes telling = {0x00, 0x01, 0x02, 0x03, 0x04, 0x30, 0x7F, 0x80, 0x81, 0x82, 0xFE, 0xFF};
  for (std::size_t size = 0; size <= 2; ++size) every_string({}, all_bytes(), size, 2);
  every_string({0x30}, all_bytes(), 3, 2);
  every_string({0x30}, telling, 4, 2);
  every_string({0x30, 0x02}, all_bytes(), 4, 2);
  every_string({0x30, 0x81}, all_bytes(), 4, 2);
  for (const std::uint8_t first : all_bytes()) {
    for (std::size_t size = 3; size <= 4; ++size) every_string({first}, telling, size, 2);
  }
  EXPECT_EQ(accepted_, 0);
}

TEST_F(SignatureSweepTest, InputsOfFiveToEightBytesAreJudgedAlikeAndLibcryptoAgrees) {
  const bytes telling = {0x00, 0x01, 0x02, 0x03, 0x04, 0x05, 0x30, 0x7F, 0x80, 0x81, 0xFF};
  for (std::size_t size = 4; size <= 6; ++size) every_string({0x30}, telling, size, 1);
  EXPECT_EQ(accepted_, 1);  // 30 04 02 00 02 00
  every_string({0x30, 0x05}, telling, 7, 1);
  // Either number is 0 and the other of one byte, of which eight are below 80; or both are, of two and of no bytes …
  EXPECT_EQ(accepted_, 1 + 2 * 7);
  const bytes fewer = {0x00, 0x01, 0x02, 0x03, 0x06, 0x7F, 0x80};
  every_string({0x30, 0x06}, fewer, 8, 2);
  EXPECT_GT(accepted_, 1 + 2 * 7 + 25);
}

TEST_F(SignatureSweepTest, WhatIsOneByteAwayFromASignatureIsJudgedAlike) {
  for (const std::uint32_t bits : ec_sizes) {
    const ec_test_key& key = ec_test_key::of_bits(bits);
    const std::size_t half = key.fields().half();
    const bytes signature = key.sign(KM_DIGEST_SHA_2_256, from_text("one of many"));
    ASSERT_NO_FATAL_FAILURE(check(signature, half));
    for (std::size_t at = 0; at < signature.size(); ++at) {
      bytes changed = signature;
      for (unsigned step = 1; step < 256; ++step) {
        ++changed[at];
        ASSERT_NO_FATAL_FAILURE(check(changed, half));
      }
    }
  }
  EXPECT_GT(accepted_, 1000);  // in most places it is another number
}

TEST_F(SignatureSweepTest, WhatIsShorterOrLongerThanASignatureIsNone) {
  int signatures = 0;
  for (const std::uint32_t bits : ec_sizes) {
    const ec_test_key& key = ec_test_key::of_bits(bits);
    const std::size_t half = key.fields().half();
    for (int round = 0; round < 4; ++round, ++signatures) {
      const bytes signature = key.sign(KM_DIGEST_SHA_2_256, pattern(20, static_cast<std::uint32_t>(round)));
      ASSERT_NO_FATAL_FAILURE(check(signature, half));
      for (std::size_t size = 0; size < signature.size(); ++size) {
        ASSERT_NO_FATAL_FAILURE(
            check({signature.begin(), signature.begin() + static_cast<std::ptrdiff_t>(size)}, half));
        ASSERT_NO_FATAL_FAILURE(check({signature.end() - static_cast<std::ptrdiff_t>(size), signature.end()}, half));
      }
      for (const std::uint8_t extra : all_bytes()) {
        ASSERT_NO_FATAL_FAILURE(check(join({signature, {extra}}), half));
        ASSERT_NO_FATAL_FAILURE(check(join({{extra}, signature}), half));
        bytes longer = join({signature, {extra}});
        ++longer[bits == 521 ? 2 : 1];  // a longer sequence that says so
        ASSERT_NO_FATAL_FAILURE(check(longer, half));
      }
    }
  }
  EXPECT_EQ(accepted_, signatures);
}

}  // namespace
}  // namespace testing_support
