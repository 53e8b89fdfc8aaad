// Verifying with EC: whatever is wrong with a signature, or with checking it, is a failed verification.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr const char* decode_line = "Decode signature failed, 0xffff0000";

class EcVerifyTest : public CommandTest {
 protected:
  const ec_test_key& key = ec_test_key::of_bits(256);
  const bytes blob = client().must_import(ec_key(256), key.material());
  const param_list params = ec_digest(KM_DIGEST_SHA_2_256);
  const bytes message = from_text("the message");
  const bytes signature = key.sign(KM_DIGEST_SHA_2_256, message);

  /// expect_wrong verifies and expects the refusal after these lines.
  void expect_wrong(const bytes& text, const bytes& given, trace_lines own_lines = {}) {
    own_lines.emplace_back("Finish failed");
    expect_failure(refused(KM_ERROR_VERIFICATION_FAILED, std::move(own_lines)),
                   [&] { return client().verify(blob, params, text, given); });
  }
  bytes r() const { return half(0); }
  bytes s() const { return half(32); }

 private:
  [[nodiscard]] bytes half(std::ptrdiff_t at) const {
    const bytes raw = raw_of(signature, 32);
    return {raw.begin() + at, raw.begin() + at + 32};
  }
};

TEST_F(EcVerifyTest, LibcryptosSignaturesHoldOnEachCurveWithEachDigest) {
  for (const std::uint32_t bits : ec_sizes) {
    const ec_test_key& other = ec_test_key::of_bits(bits);
    const bytes imported = client().must_import(ec_key(bits), other.material());
    for (const std::uint32_t digest : every_sha) {
      SCOPED_TRACE(fmt::format("{} bits, digest {}", bits, digest));
      const bytes text = pattern(321, bits);
      const bytes made = other.sign(digest, text);
      const hosted_tee::accounting before = tee.accounting();
      const finish_answer good = succeeds([&] { return client().verify(imported, ec_digest(digest), text, made); });
      expect_same(before);
      EXPECT_TRUE(good.data.empty());
      EXPECT_EQ(client().verify(imported, ec_digest(digest), flip(text, 0), made).error, KM_ERROR_VERIFICATION_FAILED);
    }
  }
}

TEST_F(EcVerifyTest, VerifyingNeedsNoPrivateValueThatBelongsToThePoint) {
  ec_fields odd = key.fields();
  odd.d = {1};
  const bytes imported = client().must_import(ec_key(256), odd.material());
  (void)succeeds([&] { return client().verify(imported, params, message, signature); });
}

TEST_F(EcVerifyTest, ASignatureOfAnotherMessageKeyOrDigestIsWrongWithoutALineOfItsOwn) {
  expect_wrong(from_text("the massage"), signature);
  expect_wrong({}, signature);
  expect_wrong(message, key.sign(KM_DIGEST_SHA1, message));
  const bytes other = client().must_generate(ec_key(256));
  expect_failure(refused(KM_ERROR_VERIFICATION_FAILED, {"Finish failed"}),
                 [&] { return client().verify(other, params, message, signature); });
}

TEST_F(EcVerifyTest, NumbersOutsideTheOrderAreWrongWithoutALineOfTheirOwn) {
  for (const bytes& bad : {ec_order(256), bytes(32, 0xFF)}) {
    expect_wrong(message, der_of(bad, s()));
    expect_wrong(message, der_of(r(), bad));
  }
  // Zero, in the form that this coder gives it.
  expect_wrong(message, from_hex("300402000200"));
  expect_wrong(message, from_hex("30050201010200"));
  expect_wrong(message, from_hex("30050200020101"));
  expect_wrong(message, der_of(s(), r()));
}

TEST_F(EcVerifyTest, AFlippedBitAnywhereIsWrong) {
  for (std::size_t at = 0; at < signature.size(); ++at) {
    const finish_answer a = client().verify(blob, params, message, flip(signature, at));
    EXPECT_EQ(a.result, TEEC_SUCCESS) << at;
    EXPECT_EQ(a.error, KM_ERROR_VERIFICATION_FAILED) << at;
  }
}

TEST_F(EcVerifyTest, WhatIsNoSignatureFailsToDecode) {
  expect_wrong(message, {}, {"Wrong der length\n", decode_line});
  expect_wrong(message, {0x30}, {"Wrong der length\n", decode_line});
  expect_wrong(message, from_hex("3000"), {"Decode length failed", decode_line});
  expect_wrong(message, from_hex("308506000000"), {"Decode length failed", decode_line});
  expect_wrong(message, bytes(3000, 0x59), {"Wrong tag, expect 0x30, got 0x59", decode_line});
  const auto left = signature.size() - 2;
  expect_wrong(message, join({signature, {0}}),
               {fmt::format("Wrong length of sequence, expect {}B, got {}B", left + 1, left), decode_line});
}

TEST_F(EcVerifyTest, ANumberOf33BytesIsTooLongAndSaysSo) {
  const bytes longer = join({{0x11}, r()});
  expect_wrong(message, der_of(longer, s()), {"Wrong length of R, expect max 32B, got 33B", decode_line});
  expect_wrong(message, der_of(r(), longer), {"Wrong length of S, expect max 32B, got 33B", decode_line});
}

TEST_F(EcVerifyTest, AnotherFormOfTheSameSignatureIsWrong) {
  const auto element = [](const bytes& content) {
    return join({{0x02, static_cast<std::uint8_t>(content.size())}, content});
  };
  const auto sequence = [](const bytes& body) { return join({{0x30, static_cast<std::uint8_t>(body.size())}, body}); };
  const bytes fixed_r = join({{0}, r()}), fixed_s = join({{0}, s()});
  for (const bytes& form :
       {sequence(join({element(join({{0}, fixed_r})), element(fixed_s)})),                     // a zero too many
        join({{0x30, 0x81, signature.at(1)}, bytes(signature.begin() + 2, signature.end())}),  // a longer length
        sequence(join({bytes(signature.begin() + 2, signature.end()), {0x05, 0x00}}))}) {      // more inside
    const finish_answer a = client().verify(blob, params, message, form);
    EXPECT_EQ(a.error, KM_ERROR_VERIFICATION_FAILED) << to_hex(form);
    EXPECT_TRUE(tee.traced(decode_line));
  }
}

TEST_F(EcVerifyTest, RWithTwoZerosInFrontDecodesButIsNotTheCanonicalForm) {
  bytes short_r = r();
  short_r.front() = 0;  // 31 significant bytes behind 00 00
  const bytes given = join({{0x30, 0x26, 0x02, 0x21, 0x00}, short_r, {0x02, 0x01, 0x01}});
  expect_wrong(message, given, {"Encoding size mismatch", decode_line});
}

TEST_F(EcVerifyTest, WhateverThePlatformFailsWithIsAFailedVerification) {
  const hosted_tee::accounting before = tee.accounting();
  for (const TEE_Result result : {TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_BAD_PARAMETERS, TEE_ERROR_GENERIC}) {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, blob, params);
    EXPECT_TRUE(client().update(handle, message).ok());
    tee.world().faults().fail_call("TEE_AsymmetricVerifyDigest", 1, result);
    (void)expect_lost(refused(KM_ERROR_VERIFICATION_FAILED,
                              {fmt::format("TEE_AsymmetricVerifyDigest return {:#010x}", result), "Finish failed"}),
                      handle, before, [&] { return client().finish(handle, signature); });
  }
}

TEST_F(EcVerifyTest, AFailingDigestIsThePlatformsFailure) {
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, blob, params);
  tee.world().faults().fail_call("TEE_DigestDoFinal", 1, TEE_ERROR_ACCESS_DENIED);
  (void)expect_lost(broken(TEEC_ERROR_ACCESS_DENIED, {"DigestDoFinal failed with 0xffff0001\n", "Finish failed"}),
                    handle, before, [&] { return client().finish(handle, signature); });
}

TEST_F(EcVerifyTest, WithoutMemoryThereIsNoVerdict) {
  const hosted_tee::accounting before = tee.accounting();
  const failure no_buffer = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {"Out of memory", "Finish failed"});
  const failure no_check =
      refused(KM_ERROR_VERIFICATION_FAILED,
              {"Out of memory", "Out of memory", "Decode signature failed, 0xffff000c", "Finish failed"});
  std::uint32_t n = 0;
  for (const failure* const expected : {&no_buffer, &no_buffer, &no_check}) {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, blob, params);
    tee.world().faults().fail_allocation(++n);
    (void)expect_lost(*expected, handle, before, [&] { return client().finish(handle, signature); });
  }
}

}  // namespace
}  // namespace testing_support
