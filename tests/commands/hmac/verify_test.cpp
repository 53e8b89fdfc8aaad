// Checking MACs: exactly as many bytes are compared as were asked for at begin.
#include "tests/commands/command_fixture.h"
#include "tests/support/hmac_test_key.h"
#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

class HmacVerifyTest : public CommandTest {
 protected:
  const bytes key = pattern(32, 5);
  const bytes blob = client().must_import(hmac_key(KM_DIGEST_SHA_2_256, 256), key);
  const bytes message = from_text("the message");
  const bytes mac = hmac_of(KM_DIGEST_SHA_2_256, key, message);

  finish_answer verify(std::uint32_t bits, const bytes& given) {
    return client().verify(blob, hmac_length(bits), message, given);
  }
  void expect_mismatch(std::uint32_t bits, const bytes& given) {
    expect_failure(refused(KM_ERROR_VERIFICATION_FAILED, {"Signature mismatch", "Finish failed"}),
                   [&] { return verify(bits, given); });
  }
  [[nodiscard]] bytes first(std::size_t size) const {
    return {mac.begin(), mac.begin() + static_cast<std::ptrdiff_t>(size)};
  }
};

TEST_F(HmacVerifyTest, LibcryptosMacsHold) {
  for (const hmac_limits& each : every_hmac) {
    const bytes secret = pattern(each.longest_key / 8);
    const bytes imported = client().must_import(hmac_key(each.digest, 0), secret);
    const bytes whole = hmac_of(each.digest, secret, message);
    for (std::uint32_t bits = 64; bits <= each.longest_mac; bits += 8) {
      const bytes cut(whole.begin(), whole.begin() + bits / 8);
      const hosted_tee::accounting before = tee.accounting();
      EXPECT_TRUE(succeeds([&] { return client().verify(imported, hmac_length(bits), message, cut); }).data.empty());
      expect_same(before);
    }
  }
}

TEST_F(HmacVerifyTest, ADifferenceInAnyByteThatCountsIsAMismatch) {
  for (const std::uint32_t bits : {64U, 128U, 256U}) {
    for (std::size_t at = 0; at < bits / 8; ++at) expect_mismatch(bits, flip(first(bits / 8), at));
  }
  expect_mismatch(256, bytes(32));
}

TEST_F(HmacVerifyTest, ASignatureThatIsTooShortIsAMismatchAndIsNotReadPastItsEnd) {
  for (std::size_t size = 0; size < 32; ++size) expect_mismatch(256, first(size));
  expect_mismatch(64, first(7));
  expect_mismatch(64, {});
}

TEST_F(HmacVerifyTest, BytesBehindThoseThatCountAreNotCompared) {
  for (const std::uint32_t bits : {64U, 128U, 256U}) {
    (void)succeeds([&] { return verify(bits, join({first(bits / 8), pattern(100)})); });
  }
  (void)succeeds([&] { return verify(128, mac); });
  (void)succeeds([&] { return verify(128, flip(mac, 16)); });
  expect_mismatch(128, flip(mac, 15));
}

TEST_F(HmacVerifyTest, OfALengthInBitsTheLastOnesThatMakeNoByteDontCount) {
  for (const std::uint32_t bits : {65U, 71U}) (void)succeeds([&] { return verify(bits, first(8)); });
  (void)succeeds([&] { return verify(100, first(12)); });
  expect_mismatch(100, first(11));
  expect_mismatch(72, first(8));
}

TEST_F(HmacVerifyTest, AMacOfAnotherMessageKeyOrDigestIsAMismatch) {
  const failure expected = refused(KM_ERROR_VERIFICATION_FAILED, {"Signature mismatch", "Finish failed"});
  expect_failure(expected, [&] { return client().verify(blob, hmac_length(256), from_text("the massage"), mac); });
  expect_mismatch(256, hmac_of(KM_DIGEST_SHA_2_256, pattern(32, 6), message));
  expect_mismatch(256, hmac_of(KM_DIGEST_SHA_2_512, key, message));
  expect_mismatch(256, digest_of(KM_DIGEST_SHA_2_256, message));
}

}  // namespace
}  // namespace testing_support
