// begin with an EC key: which digests it takes, and how it fails.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t both_purposes[] = {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY};

class EcBeginTest : public CommandTest {
 protected:
  const bytes blob = client().must_import(ec_key(256), ec_test_key::of_bits(256).material());

  void expect_refused(const failure& expected, std::uint32_t purpose, const bytes& key, const param_list& params) {
    const answer a = expect_failure(expected, [&] { return client().begin(purpose, key, params); });
    EXPECT_EQ(a.b, 0U);
  }
};

TEST_F(EcBeginTest, EachCurveTakesEachDigestButMd5) {
  for (const std::uint32_t bits : ec_sizes) {
    const bytes key = client().must_import(ec_key(bits), ec_test_key::of_bits(bits).material());
    const hosted_tee::accounting before = tee.accounting();
    for (const std::uint32_t purpose : both_purposes) {
      for (std::uint32_t digest = KM_DIGEST_NONE; digest <= KM_DIGEST_SHA_2_512; ++digest) {
        SCOPED_TRACE(fmt::format("{} bits, purpose {}, digest {}", bits, purpose, digest));
        if (digest == KM_DIGEST_MD5) {
          expect_refused(refused(KM_ERROR_INCOMPATIBLE_DIGEST, {"Create operation failed"}), purpose, key,
                         ec_digest(digest));
          continue;
        }
        const answer a = succeeds([&] { return client().begin(purpose, key, ec_digest(digest)); });
        EXPECT_EQ(a.body(), u32(0));
        EXPECT_EQ(tee.accounting().operations, before.operations + (digest == KM_DIGEST_NONE ? 1 : 2));
        EXPECT_TRUE(client().abort(a.b).ok());
        expect_same(before);
      }
    }
  }
}

TEST_F(EcBeginTest, AnUnknownDigestIsUnsupported) {
  for (const std::uint32_t digest : {7U, 8U, 0x80000002U, 0xFFFFFFFFU}) {
    const bytes lenient =
        client().must_import(ec_key(256).add(KM_TAG_DIGEST, digest), ec_test_key::of_bits(256).material());
    for (const std::uint32_t purpose : both_purposes) {
      expect_refused(refused(KM_ERROR_UNSUPPORTED_DIGEST, {"Create operation failed"}), purpose, lenient,
                     ec_digest(digest));
    }
  }
}

TEST_F(EcBeginTest, TheDigestMustOccurOnce) {
  const failure expected =
      refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_DIGEST", "Create operation failed"});
  for (const std::uint32_t purpose : both_purposes) {
    expect_refused(expected, purpose, blob, {});
    expect_refused(expected, purpose, blob, ec_digest(KM_DIGEST_SHA1).add(KM_TAG_DIGEST, KM_DIGEST_SHA1));
  }
}

TEST_F(EcBeginTest, WhatTheKeyDoesntListIsThePolicysToRefuseAndOnlyForSigning) {
  const bytes strict = client().must_import(ec_key(256).remove(KM_TAG_DIGEST).add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256),
                                            ec_test_key::of_bits(256).material());
  expect_refused(refused(KM_ERROR_INCOMPATIBLE_DIGEST, {"No such digest in key_params", "Authorization failed"}),
                 KM_PURPOSE_SIGN, strict, ec_digest(KM_DIGEST_SHA1));
  EXPECT_TRUE(client().begin(KM_PURPOSE_VERIFY, strict, ec_digest(KM_DIGEST_SHA1)).ok());
}

TEST_F(EcBeginTest, EcNeitherEncryptsNorDecrypts) {
  expect_refused(refused(KM_ERROR_UNSUPPORTED_PURPOSE, {"Algorithm EC purpose 0 not implemented"}), KM_PURPOSE_ENCRYPT,
                 blob, ec_digest(KM_DIGEST_NONE));
  expect_refused(refused(KM_ERROR_UNSUPPORTED_PURPOSE, {"Authorization failed"}), KM_PURPOSE_DECRYPT, blob,
                 ec_digest(KM_DIGEST_NONE));
}

TEST_F(EcBeginTest, AKeyThatThePlatformRefusesFailsHere) {
  const ec_fields& good = ec_test_key::of_bits(256).fields();
  ec_fields off_curve = good;
  off_curve.y.back() ^= 1;
  const failure expected = broken(TEEC_ERROR_BAD_PARAMETERS, {"PopulateTransientObject failed with 0xffff0006\n",
                                                              "Resolve key data failed", "Create operation failed"});
  for (const ec_fields& bad :
       {off_curve, ec_fields{256, {}, {}, {}}, ec_fields{256, good.x, good.y, {}},
        ec_fields{256, good.x, good.y, bytes(32)}, ec_fields{256, good.x, good.y, ec_order(256)},
        ec_fields{256, good.x, good.y, bytes(32, 0xFF)}, ec_fields{256, bytes(32, 0xFF), good.y, good.d},
        ec_fields{256, bytes(3000, 0xFF), good.y, good.d}, ec_fields{384, good.x, good.y, good.d}}) {
    const bytes key = client().must_import(ec_key(bad.bits), bad.material());
    for (const std::uint32_t purpose : both_purposes) {
      expect_refused(expected, purpose, key, ec_digest(KM_DIGEST_SHA_2_256));
    }
  }
}

TEST_F(EcBeginTest, LeadingZerosOfTheValuesDontMatter) {
  const ec_test_key& key = ec_test_key::of_bits(256);
  ec_fields padded = key.fields();
  for (bytes* const value : {&padded.x, &padded.y, &padded.d}) *value = join({bytes(40), *value});
  const bytes imported = client().must_import(ec_key(256), padded.material());
  const bytes made = client().sign(imported, ec_digest(KM_DIGEST_SHA1), from_text("m")).data;
  EXPECT_TRUE(key.verifies(KM_DIGEST_SHA1, from_text("m"), made));
}

TEST_F(EcBeginTest, KeyDataOfABlobThatNoImportWouldTakeIsRefused) {
  const auto sealed = [&](const bytes& key_data) {
    return seal_blob(stored_ksk(), sealed_by_rpmb_ksk, blob_plaintext(key_data, ec_key(256).marshal()));
  };
  const bytes material = ec_test_key::of_bits(256).material();
  expect_refused(broken(TEEC_ERROR_GENERIC, {"Too short input", "Resolve key data failed", "Create operation failed"}),
                 KM_PURPOSE_SIGN, sealed({material.begin(), material.end() - 1}), ec_digest(KM_DIGEST_NONE));
  expect_refused(refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {"Resolve key data failed", "Create operation failed"}),
                 KM_PURPOSE_SIGN, sealed(ec_fields{255, {1}, {2}, {3}}.material()), ec_digest(KM_DIGEST_NONE));
}

TEST_F(EcBeginTest, EachPlatformFailureHasItsLinesAndItsResult) {
  struct platform_failure {
    const char* call;
    std::uint32_t n;  // of begin's calls of that function; the first two belong to the blob
    std::uint32_t digest;
    trace_lines lines;
  };
  const std::string code = " failed with 0xffff0001\n", resolve = "Resolve key data failed",
                    create = "Create operation failed";
  for (const platform_failure& row : std::vector<platform_failure>{
           {"TEE_AllocateTransientObject", 2, 4, {"AllocateTransientObject" + code, resolve, create}},
           {"TEE_PopulateTransientObject", 2, 4, {"PopulateTransientObject" + code, resolve, create}},
           {"TEE_AllocateOperation", 3, 4, {"AllocateOperation" + code, create}},
           {"TEE_AllocateOperation", 4, 4, {"AllocateOperation" + code, create}},
           {"TEE_AllocateOperation", 3, 0, {"AllocateOperation" + code, create}},
           {"TEE_SetOperationKey", 3, 4, {"SetOperationKey" + code, create}}}) {
    for (const std::uint32_t purpose : both_purposes) {
      SCOPED_TRACE(fmt::format("{} number {}", row.call, row.n));
      tee.world().faults().fail_call(row.call, row.n, TEE_ERROR_ACCESS_DENIED);
      expect_refused(broken(TEEC_ERROR_ACCESS_DENIED, row.lines), purpose, blob, ec_digest(row.digest));
    }
  }
}

TEST_F(EcBeginTest, WithoutMemoryForTheRecordOrTheDigestThereIsNoOperation) {
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t first = tee.world().faults().allocations();
  EXPECT_TRUE(client().abort(client().must_begin(KM_PURPOSE_SIGN, blob, ec_digest(KM_DIGEST_SHA1))).ok());
  const std::uint32_t all = tee.world().faults().allocations() - first;
  int record = 0, digest = 0;
  for (std::uint32_t n = 1; n <= all; ++n) {
    tee.clear_trace();
    tee.world().faults().fail_allocation(n);
    const answer a = client().begin(KM_PURPOSE_SIGN, blob, ec_digest(KM_DIGEST_SHA1));
    EXPECT_FALSE(a.ok()) << n;
    expect_same(before);
    if (lines() != trace_lines{"Out of memory", "Create operation failed"}) continue;
    EXPECT_EQ(a.result, TEEC_SUCCESS);
    record += a.error == KM_ERROR_UNKNOWN_ERROR;
    digest += a.error == KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  EXPECT_EQ(record, 1);
  EXPECT_EQ(digest, 1);
}

}  // namespace
}  // namespace testing_support
