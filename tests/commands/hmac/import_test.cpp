// import_key for HMAC: the same checks on a raw key, whose length tells its size.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/hmac_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class HmacImportTest : public CommandTest {
 protected:
  void expect_refused(const failure& expected, const param_list& params, const bytes& material) {
    const answer a = expect_failure(expected, [&] { return client().import_key(params, material, 2048); });
    EXPECT_EQ(a.output, bytes(2048, 0));
  }
};

TEST_F(HmacImportTest, TheKeyStandsBehindItsSizeAndTheObjectTypeOfItsDigest) {
  for (const hmac_limits& each : every_hmac) {
    SCOPED_TRACE(each.digest);
    const bytes key = pattern(each.longest_key / 8);
    const param_list asked = hmac_key(each.digest, each.longest_key);
    param_list stored = asked;
    stored.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);
    const hosted_tee::accounting before = tee.accounting();
    const answer a = succeeds([&] { return client().import_key(asked, key); });
    expect_same(before);
    const bytes blob(a.output.begin() + 4, a.output.begin() + 4 + u32_at(a.output, 0));
    EXPECT_EQ(a.body(), join({prefixed(blob), prefixed(stored.marshal())}));
    EXPECT_EQ(open_blob(stored_ksk(), blob),
              blob_plaintext(join({u32(each.longest_key), u32(each.object_type), key}), stored.marshal()));
  }
}

TEST_F(HmacImportTest, ASizeThatIsNotStatedIsTakenFromTheKey) {
  for (const bool twice : {false, true}) {
    param_list asked = hmac_key(KM_DIGEST_SHA1, 0);
    if (twice) asked.add(KM_TAG_KEY_SIZE, 80).add(KM_TAG_KEY_SIZE, 88);  // repeated: as good as none
    param_list stored = asked;
    stored.add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED).add(KM_TAG_KEY_SIZE, 160);
    const bytes plaintext = open_blob(stored_ksk(), client().must_import(asked, pattern(20))).value();
    EXPECT_EQ(plaintext,
              blob_plaintext(join({u32(160), u32(every_hmac[1].object_type), pattern(20)}), stored.marshal()));
  }
}

TEST_F(HmacImportTest, TwentyFourBytesAreEnoughForSha256AndTwentyThreeAreNot) {
  EXPECT_TRUE(client().import_key(hmac_key(KM_DIGEST_SHA_2_256, 0), pattern(24)).ok());
  expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {"Invalid HMAC key size 184"}),
                 hmac_key(KM_DIGEST_SHA_2_256, 0), pattern(23));
}

TEST_F(HmacImportTest, EachDigestHasItsShortestAndLongestKey) {
  for (const hmac_limits& each : every_hmac) {
    for (std::uint32_t bits = 0; bits <= 1040; bits += 8) {
      SCOPED_TRACE(fmt::format("digest {}, {} bits", each.digest, bits));
      const param_list params = hmac_key(each.digest, 0);
      if (bits < 64) {
        expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {fmt::format("Invalid hmac key size {}", bits)}), params,
                       bytes(bits / 8));
      } else if (bits < each.shortest_key || bits > each.longest_key) {
        expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {fmt::format("Invalid HMAC key size {}", bits)}), params,
                       bytes(bits / 8));
      } else {
        EXPECT_TRUE(client().import_key(params, bytes(bits / 8)).ok());
      }
    }
  }
}

TEST_F(HmacImportTest, WhatIsWrongWithARequestIsFoundInThisOrder) {
  param_list params = param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC).add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
  params.add(KM_TAG_KEY_SIZE, 256);
  const bytes key = pattern(7);
  expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, {"Shouldn't specify KM_TAG_ORIGIN"}), params, key);
  params.remove(KM_TAG_ORIGIN);
  expect_refused(refused(KM_ERROR_IMPORT_PARAMETER_MISMATCH, {"Key size mismatch (given 256, guessed 56)"}), params,
                 key);
  params.remove(KM_TAG_KEY_SIZE);
  expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {"Invalid hmac key size 56"}), params, key);
  const bytes longer = pattern(16);
  expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_MIN_MAC_LENGTH or specified"}), params,
                 longer);
  params.add(KM_TAG_MIN_MAC_LENGTH, 63);
  expect_refused(refused(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH, {"Invalid KM_TAG_MIN_MAC_LENGTH 63"}), params, longer);
  params.remove(KM_TAG_MIN_MAC_LENGTH).add(KM_TAG_MIN_MAC_LENGTH, 264);
  expect_refused(refused(KM_ERROR_UNSUPPORTED_DIGEST, {"No or too many KM_TAG_DIGEST"}), params, longer);
  params.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
  expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {"Invalid HMAC key size 128"}), params, longer);
  expect_refused(refused(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH, {"Invalid KM_TAG_MIN_MAC_LENGTH 264"}), params,
                 pattern(32));
  params.remove(KM_TAG_MIN_MAC_LENGTH).add(KM_TAG_MIN_MAC_LENGTH, 256);
  EXPECT_TRUE(client().import_key(params, pattern(32)).ok());
}

TEST_F(HmacImportTest, WithoutMemoryForTheKeyDataThereIsNoKey) {
  const param_list params = hmac_key(KM_DIGEST_SHA_2_256, 256);
  (void)client().must_import(params, pattern(32));
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t first = tee.world().faults().allocations();
  (void)client().must_import(params, pattern(32));
  const std::uint32_t all = tee.world().faults().allocations() - first;
  int found = 0;
  for (std::uint32_t n = 1; n <= all; ++n) {
    tee.clear_trace();
    tee.world().faults().fail_allocation(n);
    const answer a = client().import_key(params, pattern(32), 2048);
    EXPECT_FALSE(a.ok()) << n;
    EXPECT_EQ(a.output, bytes(2048, 0));
    expect_same(before);
    found += a.error == KM_ERROR_MEMORY_ALLOCATION_FAILED && lines() == trace_lines{"Out of memory"};
  }
  EXPECT_EQ(found, 3);  // the material's copy, the list of parameters for the origin, the key data
}

TEST_F(HmacImportTest, AKeyIsNeverGivenOut) {
  const bytes imported = client().must_import(hmac_key(KM_DIGEST_SHA1, 160), pattern(20));
  const bytes generated = client().must_generate(hmac_key(KM_DIGEST_SHA1, 160));
  for (const bytes& blob : {imported, generated}) {
    const answer a = expect_failure(refused(KM_ERROR_UNSUPPORTED_KEY_FORMAT, {"Export key failed"}),
                                    [&] { return client().export_key(blob); });
    EXPECT_EQ(a.output, bytes(a.output.size(), canary));
  }
}

}  // namespace
}  // namespace testing_support
