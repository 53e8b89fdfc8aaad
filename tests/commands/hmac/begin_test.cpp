// begin with an HMAC key: the digest is the key's, the length of the MAC the client's.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/hmac_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t both_purposes[] = {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY};
constexpr std::uint32_t sha256_type = 0xA0000004, aes_type = 0xA0000010;

class HmacBeginTest : public CommandTest {
 protected:
  const bytes blob = client().must_import(hmac_key(KM_DIGEST_SHA_2_256, 256, 128), pattern(32));

  void expect_refused(const failure& expected, std::uint32_t purpose, const bytes& key, const param_list& params) {
    const answer a = expect_failure(expected, [&] { return client().begin(purpose, key, params); });
    EXPECT_EQ(a.b, 0U);
  }

  /// A blob with any key data, as no import would make it.
  bytes sealed(const bytes& key_data) {
    return seal_blob(stored_ksk(), sealed_by_rpmb_ksk,
                     blob_plaintext(key_data, hmac_key(KM_DIGEST_SHA_2_256, 256).marshal()));
  }
};

TEST_F(HmacBeginTest, KeysOfEachDigestBeginBothPurposesAndGiveEverythingBack) {
  for (const hmac_limits& each : every_hmac) {
    const bytes key = client().must_import(hmac_key(each.digest, 0), pattern(each.shortest_key / 8));
    const hosted_tee::accounting before = tee.accounting();
    for (const std::uint32_t purpose : both_purposes) {
      const answer a = succeeds([&] { return client().begin(purpose, key, hmac_length(64)); });
      EXPECT_EQ(a.body(), u32(0));
      EXPECT_EQ(tee.accounting().operations, before.operations + 1);
      EXPECT_TRUE(client().abort(a.b).ok());
      expect_same(before);
    }
  }
}

TEST_F(HmacBeginTest, TheLengthOfTheMacMustOccurOnceAlsoToVerify) {
  const failure expected =
      refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_MAC_LENGTH", "Create operation failed"});
  for (const std::uint32_t purpose : both_purposes) {
    expect_refused(expected, purpose, blob, {});
    expect_refused(expected, purpose, blob, hmac_length(256).add(KM_TAG_MAC_LENGTH, 256));
  }
}

TEST_F(HmacBeginTest, LengthsBelowTheKeysShortestAreRefusedAndNoneIsTooLong) {
  for (const std::uint32_t purpose : both_purposes) {
    for (const std::uint32_t bits : {0U, 1U, 64U, 120U, 127U}) {
      expect_refused(refused(KM_ERROR_INVALID_MAC_LENGTH, {"Authorization failed"}), purpose, blob, hmac_length(bits));
    }
    for (const std::uint32_t bits : {128U, 129U, 256U, 264U, 512U, 0x80000000U, 0xFFFFFFFFU}) {
      const answer a = succeeds([&] { return client().begin(purpose, blob, hmac_length(bits)); });
      EXPECT_TRUE(client().abort(a.b).ok());
    }
  }
}

TEST_F(HmacBeginTest, TheDigestNeedNotBeNamedAndMayOnlyBeTheKeys) {
  const failure other = refused(KM_ERROR_INCOMPATIBLE_DIGEST, {"No such digest in key_params", "Authorization failed"});
  for (const std::uint32_t purpose : both_purposes) {
    for (const std::uint32_t digest : {KM_DIGEST_NONE, KM_DIGEST_SHA1, KM_DIGEST_SHA_2_512}) {
      expect_refused(other, purpose, blob, hmac_length(256).add(KM_TAG_DIGEST, digest));
    }
    EXPECT_TRUE(client().begin(purpose, blob, hmac_length(256).add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)).ok());
  }
}

TEST_F(HmacBeginTest, HmacNeitherEncryptsNorDecrypts) {
  for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}) {
    expect_refused(refused(KM_ERROR_UNSUPPORTED_PURPOSE, {"Authorization failed"}), purpose, blob, hmac_length(256));
  }
}

TEST_F(HmacBeginTest, KeyDataThatEndsTooSoonIsRefused) {
  const bytes whole = join({u32(256), u32(sha256_type), pattern(32)});
  const failure expected =
      broken(TEEC_ERROR_GENERIC, {"Too short input", "Resolve key data failed", "Create operation failed"});
  for (const std::size_t size : {0U, 3U, 4U, 7U, 8U, 39U}) {
    SCOPED_TRACE(size);
    expect_refused(expected, KM_PURPOSE_SIGN,
                   sealed({whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)}), hmac_length(256));
  }
  EXPECT_TRUE(client().begin(KM_PURPOSE_SIGN, sealed(whole), hmac_length(256)).ok());
  EXPECT_TRUE(client().begin(KM_PURPOSE_SIGN, sealed(join({whole, pattern(9)})), hmac_length(256)).ok());
  expect_refused(expected, KM_PURPOSE_SIGN, sealed(join({u32(0xFFFFFFFF), u32(sha256_type), pattern(32)})),
                 hmac_length(256));
}

TEST_F(HmacBeginTest, ATypeThatIsNoHmacIsAnInvalidBlobAfterTheLengthWasLookedAt) {
  const bytes key = sealed(join({u32(128), u32(aes_type), pattern(16)}));
  for (const std::uint32_t purpose : both_purposes) {
    expect_refused(refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_MAC_LENGTH", "Create operation failed"}),
                   purpose, key, {});
    expect_refused(refused(KM_ERROR_INVALID_KEY_BLOB, {"Unsupported key type", "Create operation failed"}), purpose,
                   key, hmac_length(256));
  }
}

TEST_F(HmacBeginTest, ATypeOrSizeThatThePlatformDoesntKnowFailsThere) {
  const failure expected = broken(TEEC_ERROR_NOT_SUPPORTED, {"AllocateTransientObject failed with 0xffff000a\n",
                                                             "Resolve key data failed", "Create operation failed"});
  for (const bytes& key_data :
       {join({u32(256), u32(0), pattern(32)}), join({u32(256), u32(0xA0000007), pattern(32)}),
        join({u32(184), u32(sha256_type), pattern(23)}), join({u32(1032), u32(sha256_type), pattern(129)}),
        join({u32(255), u32(sha256_type), pattern(32)}), join({u32(0), u32(sha256_type)})}) {
    expect_refused(expected, KM_PURPOSE_SIGN, sealed(key_data), hmac_length(256));
  }
}

TEST_F(HmacBeginTest, EachPlatformFailureHasItsLinesAndItsResult) {
  struct platform_failure {
    const char* call;
    std::uint32_t n;  // of begin's calls of that function; the first two belong to the blob
    trace_lines lines;
  };
  const std::string code = " failed with 0xffff0001\n", resolve = "Resolve key data failed",
                    create = "Create operation failed";
  for (const platform_failure& row : std::vector<platform_failure>{
           {"TEE_AllocateTransientObject", 2, {"AllocateTransientObject" + code, resolve, create}},
           {"TEE_PopulateTransientObject", 2, {"PopulateTransientObject" + code, resolve, create}},
           {"TEE_AllocateOperation", 3, {"AllocateOperation" + code, create}},
           {"TEE_SetOperationKey", 3, {"SetOperationKey" + code, create}}}) {
    for (const std::uint32_t purpose : both_purposes) {
      SCOPED_TRACE(fmt::format("{} number {}", row.call, row.n));
      tee.world().faults().fail_call(row.call, row.n, TEE_ERROR_ACCESS_DENIED);
      expect_refused(broken(TEEC_ERROR_ACCESS_DENIED, row.lines), purpose, blob, hmac_length(256));
    }
  }
}

TEST_F(HmacBeginTest, WithoutMemoryForTheRecordThereIsNoOperation) {
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t first = tee.world().faults().allocations();
  EXPECT_TRUE(client().abort(client().must_begin(KM_PURPOSE_SIGN, blob, hmac_length(256))).ok());
  const std::uint32_t all = tee.world().faults().allocations() - first;
  int record = 0;
  for (std::uint32_t n = 1; n <= all; ++n) {
    tee.clear_trace();
    tee.world().faults().fail_allocation(n);
    const answer a = client().begin(KM_PURPOSE_SIGN, blob, hmac_length(256));
    EXPECT_FALSE(a.ok()) << n;
    expect_same(before);
    record += a.result == TEEC_SUCCESS && a.error == KM_ERROR_UNKNOWN_ERROR &&
              lines() == trace_lines{"Out of memory", "Create operation failed"};
  }
  EXPECT_EQ(record, 1);
}

}  // namespace
}  // namespace testing_support
