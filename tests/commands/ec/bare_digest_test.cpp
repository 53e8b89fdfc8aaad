// EC without a digest of the TA's: the client brings the digest itself, and no more than the curve is wide is taken.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class BareDigestTest : public CommandTest {
 protected:
  const param_list bare = ec_digest(KM_DIGEST_NONE);

  bytes import(std::uint32_t bits) { return client().must_import(ec_key(bits), ec_test_key::of_bits(bits).material()); }

  static bytes first(const bytes& data, std::size_t size) {
    return {data.begin(), data.begin() + static_cast<std::ptrdiff_t>(size)};
  }
};

TEST_F(BareDigestTest, DigestsOfEverySizeUpToTheCurvesAreSignedAsTheyAre) {
  for (const std::uint32_t bits : ec_sizes) {
    const ec_test_key& key = ec_test_key::of_bits(bits);
    const bytes blob = import(bits);
    for (const std::size_t size :
         {std::size_t{0}, std::size_t{1}, std::size_t{20}, key.fields().half() - 1, key.fields().half()}) {
      SCOPED_TRACE(fmt::format("{} bits, {} bytes", bits, size));
      const bytes digest = pattern(size, bits);
      const bytes made = succeeds([&] { return client().sign(blob, bare, digest); }).data;
      EXPECT_TRUE(key.verifies(KM_DIGEST_NONE, digest, made));
      (void)succeeds([&] { return client().verify(blob, bare, digest, key.sign(KM_DIGEST_NONE, digest)); });
    }
  }
}

TEST_F(BareDigestTest, OfTooLongAnInputTheRestIsNotTakenAndTheOperationGoesOn) {
  for (const std::uint32_t bits : ec_sizes) {
    const ec_test_key& key = ec_test_key::of_bits(bits);
    const std::size_t half = key.fields().half();
    const bytes blob = import(bits);
    for (const std::size_t size : {half + 1, half + 100, std::size_t{70000}}) {
      SCOPED_TRACE(fmt::format("{} bits, {} bytes", bits, size));
      const bytes input = pattern(size, bits);
      const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, bare);
      const answer fed = succeeds([&] { return client().update(handle, input); });
      EXPECT_EQ(fed.b, half);
      EXPECT_EQ(fed.size, 0U);
      const bytes made = succeeds([&] { return client().finish(handle); }).data;
      EXPECT_TRUE(key.verifies(KM_DIGEST_NONE, first(input, half), made));
    }
  }
}

TEST_F(BareDigestTest, AFullBufferTakesNothingMoreAndThatIsNoError) {
  const ec_test_key& key = ec_test_key::of_bits(256);
  const bytes blob = import(256), digest = pattern(32);
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    const std::uint32_t handle = client().must_begin(purpose, blob, bare);
    EXPECT_EQ(succeeds([&] { return client().update(handle, first(digest, 30)); }).b, 30U);
    EXPECT_EQ(succeeds([&] { return client().update(handle, {}); }).b, 0U);
    EXPECT_EQ(succeeds([&] { return client().update(handle, {digest[30], digest[31], 9, 9}); }).b, 2U);
    for (const std::size_t size : {1U, 32U, 5000U}) {
      EXPECT_EQ(succeeds([&] { return client().update(handle, bytes(size)); }).b, 0U);
    }
    const bytes theirs = key.sign(KM_DIGEST_NONE, digest);
    const finish_answer done =
        succeeds([&] { return client().finish(handle, purpose == KM_PURPOSE_VERIFY ? theirs : bytes{}); });
    if (purpose == KM_PURPOSE_SIGN) {
      EXPECT_TRUE(key.verifies(KM_DIGEST_NONE, digest, done.data));
    }
  }
}

TEST_F(BareDigestTest, Of66BytesOnP521TheLeftmost521BitsAreSigned) {
  const ec_test_key& key = ec_test_key::of_bits(521);
  const bytes blob = import(521);
  bool top_bits_count = false;
  for (std::uint32_t seed = 1; seed <= 20; ++seed) {
    bytes digest = pattern(66, seed);
    digest.front() |= 0xC0;
    const bytes made = succeeds([&] { return client().sign(blob, bare, digest); }).data;
    EXPECT_TRUE(key.verifies(KM_DIGEST_NONE, digest, made));
    const bytes theirs = key.sign(KM_DIGEST_NONE, digest);
    EXPECT_TRUE(client().verify(blob, bare, digest, theirs).ok());

    bytes low_bits = digest;  // the seven last bits fall away
    low_bits.back() ^= 0x7F;
    EXPECT_TRUE(client().verify(blob, bare, low_bits, theirs).ok());
    bytes last_kept = digest;
    last_kept.back() ^= 0x80;
    EXPECT_EQ(client().verify(blob, bare, last_kept, theirs).error, KM_ERROR_VERIFICATION_FAILED);
    top_bits_count = top_bits_count || client().verify(blob, bare, flip(digest, 0), theirs).ok();
  }
  EXPECT_FALSE(top_bits_count);
}

TEST_F(BareDigestTest, Of65BytesOnP521NothingIsCut) {
  const ec_test_key& key = ec_test_key::of_bits(521);
  const bytes blob = import(521), digest = pattern(65);
  const bytes theirs = key.sign(KM_DIGEST_NONE, digest);
  EXPECT_TRUE(client().verify(blob, bare, digest, theirs).ok());
  EXPECT_FALSE(client().verify(blob, bare, flip(digest, 64), theirs).ok());
}

TEST_F(BareDigestTest, ASignatureOfADigestIsThatOfItsMessage) {
  const ec_test_key& key = ec_test_key::of_bits(384);
  const bytes blob = import(384);
  const bytes abc = from_text("abc");  // and its SHA-256, FIPS 180-4
  const bytes digest = from_hex("ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  EXPECT_TRUE(key.verifies(KM_DIGEST_SHA_2_256, abc, client().sign(blob, bare, digest).data));
  EXPECT_TRUE(client().verify(blob, ec_digest(KM_DIGEST_SHA_2_256), abc, client().sign(blob, bare, digest).data).ok());
}

}  // namespace
}  // namespace testing_support
