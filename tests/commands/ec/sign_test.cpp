// Signing with EC: libcrypto verifies what the TA made.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

class EcSignTest : public CommandTest {
 protected:
  bytes import(std::uint32_t bits) { return client().must_import(ec_key(bits), ec_test_key::of_bits(bits).material()); }

  /// Begins to sign and feeds the message.
  std::uint32_t started(const bytes& blob, std::uint32_t digest, const bytes& message) {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, ec_digest(digest));
    EXPECT_EQ(client().update(handle, message).b, message.size());
    return handle;
  }
};

TEST_F(EcSignTest, LibcryptoVerifiesSignaturesOnEachCurveWithEachDigest) {
  for (const std::uint32_t bits : ec_sizes) {
    const bytes blob = import(bits);
    for (const std::uint32_t digest : every_sha) {
      for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{700}}) {
        SCOPED_TRACE(fmt::format("{} bits, digest {}, {} bytes", bits, digest, size));
        const bytes message = pattern(size);
        const hosted_tee::accounting before = tee.accounting();
        const finish_answer made = succeeds([&] { return client().sign(blob, ec_digest(digest), message); });
        expect_same(before);
        EXPECT_TRUE(ec_test_key::of_bits(bits).verifies(digest, message, made.data));
        EXPECT_FALSE(ec_test_key::of_bits(bits).verifies(digest, join({message, {0}}), made.data));
        EXPECT_EQ(made.out_params, u32(0));
      }
    }
  }
}

TEST_F(EcSignTest, ADigestLongerThanTheCurveIsCutToItsLeftmostBytes) {
  struct row {
    std::uint32_t bits, digest;
    std::size_t kept;
  };
  const bytes message = from_text("too long a digest");
  for (const row& each : {row{192, KM_DIGEST_SHA_2_224, 24},
                          {192, KM_DIGEST_SHA_2_512, 24},
                          {224, KM_DIGEST_SHA_2_256, 28},
                          {224, KM_DIGEST_SHA_2_512, 28},
                          {256, KM_DIGEST_SHA_2_384, 32},
                          {384, KM_DIGEST_SHA_2_512, 48}}) {
    SCOPED_TRACE(fmt::format("{} bits, digest {}", each.bits, each.digest));
    bytes cut = digest_of(each.digest, message);
    cut.resize(each.kept);
    const bytes blob = import(each.bits);
    EXPECT_TRUE(ec_test_key::of_bits(each.bits).verifies(KM_DIGEST_NONE, cut,
                                                         client().sign(blob, ec_digest(each.digest), message).data));
    // Another message whose digest begins alike would have the same signature.
    EXPECT_TRUE(
        client()
            .verify(blob, ec_digest(KM_DIGEST_NONE), cut, ec_test_key::of_bits(each.bits).sign(each.digest, message))
            .ok());
  }
}

TEST_F(EcSignTest, EverySignatureIsAnotherOne) {
  const bytes blob = import(256);
  const param_list params = ec_digest(KM_DIGEST_SHA_2_256);
  EXPECT_NE(client().sign(blob, params, {1}).data, client().sign(blob, params, {1}).data);
}

TEST_F(EcSignTest, SignaturesHaveTheOneDerFormAlsoWhenAHalfIsShort) {
  const ec_test_key& key = ec_test_key::of_bits(192);
  const bytes blob = import(192);
  bool short_half = false;
  for (int round = 0; round < 2000 && !short_half; ++round) {
    const bytes made = client().sign(blob, ec_digest(KM_DIGEST_NONE), bytes(24, 1)).data;
    const bytes raw = raw_of(made, 24);
    ASSERT_EQ(made, der_of({raw.begin(), raw.begin() + 24}, {raw.begin() + 24, raw.end()}));
    short_half = raw[0] == 0 || raw[24] == 0;
    if (short_half) {
      EXPECT_TRUE(key.verifies(KM_DIGEST_NONE, bytes(24, 1), made));
    }
  }
  EXPECT_TRUE(short_half) << "one signature of 128 has one";
}

TEST_F(EcSignTest, AnUpdateAnswersNothingAndTakesAll) {
  const bytes blob = import(256);
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, ec_digest(KM_DIGEST_SHA_2_256));
  for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{100000}}) {
    const answer a = succeeds([&] { return client().update(handle, bytes(size), {}, 0); });
    EXPECT_EQ(a.b, size);
    EXPECT_EQ(a.size, 0U);
  }
  EXPECT_TRUE(client().abort(handle).ok());
}

TEST_F(EcSignTest, FinishIgnoresItsInput) {
  const bytes blob = import(256), message = from_text("message");
  const std::uint32_t handle = started(blob, KM_DIGEST_SHA_2_256, message);
  const finish_answer made = succeeds([&] { return client().finish(handle, pattern(500)); });
  EXPECT_TRUE(ec_test_key::of_bits(256).verifies(KM_DIGEST_SHA_2_256, message, made.data));
}

TEST_F(EcSignTest, EachPlatformFailureAtTheEndHasItsLineAndItsResult) {
  const bytes blob = import(521);
  const hosted_tee::accounting before = tee.accounting();
  for (const std::string call : {"DigestDoFinal", "AsymmetricSignDigest"}) {
    const std::uint32_t handle = started(blob, KM_DIGEST_SHA_2_256, {1, 2, 3});
    tee.world().faults().fail_call("TEE_" + call, 1, TEE_ERROR_ACCESS_DENIED);
    (void)expect_lost(broken(TEEC_ERROR_ACCESS_DENIED, {call + " failed with 0xffff0001\n", "Finish failed"}), handle,
                      before, [&] { return client().finish(handle); });
  }
}

TEST_F(EcSignTest, WithoutMemoryThereIsNoSignature) {
  const bytes blob = import(256);
  const hosted_tee::accounting before = tee.accounting();
  const failure raw = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {"Out of memory", "Finish failed"});
  const failure der = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {"Out of memory", "Out of memory", "Finish failed"});
  std::uint32_t n = 0;
  for (const failure* const expected : {&raw, &der}) {
    const std::uint32_t handle = started(blob, KM_DIGEST_SHA_2_256, {});
    tee.world().faults().fail_allocation(++n);
    (void)expect_lost(*expected, handle, before, [&] { return client().finish(handle); });
  }
}

TEST_F(EcSignTest, AFalseLengthOfADigestStaysInsideTheBuffer) {
  const bytes blob = import(256);
  for (const std::uint32_t length : {0U, 1U, 31U, 63U, 65U, 129U, 0xFFFFFFFFU}) {
    SCOPED_TRACE(length);
    const std::uint32_t handle = started(blob, KM_DIGEST_SHA_2_256, {1});
    tee.world().faults().override_output("TEE_DigestDoFinal", 1,
                                         [length](std::uint32_t* reported, TEE_Result&) { *reported = length; });
    const finish_answer made = succeeds([&] { return client().finish(handle); });
    EXPECT_EQ(made.data.at(0), 0x30);
    EXPECT_LE(made.data.size(), 72U);
  }
}

TEST_F(EcSignTest, ASignatureThatHasNoTwoHalvesIsNotHandedOut) {
  const bytes blob = import(256);
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t length : {0U, 1U, 63U, 65U, 66U, 128U, 0xFFFFFFFFU}) {
    SCOPED_TRACE(length);
    const std::uint32_t handle = started(blob, KM_DIGEST_SHA_2_256, {1});
    tee.world().faults().override_output("TEE_AsymmetricSignDigest", 1,
                                         [length](std::uint32_t* reported, TEE_Result&) { *reported = length; });
    (void)expect_lost(refused(KM_ERROR_UNKNOWN_ERROR, {"Finish failed"}), handle, before,
                      [&] { return client().finish(handle); });
  }
}

}  // namespace
}  // namespace testing_support
