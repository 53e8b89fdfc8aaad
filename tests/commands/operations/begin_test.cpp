// begin: what is checked in which order, and what comes back.
#include <fmt/format.h>

#include <algorithm>
#include <set>

#include "tests/commands/command_fixture.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class BeginTest : public CommandTest {
 protected:
  const bytes blob = import_fixed(512);
  const param_list raw = signature(KM_DIGEST_NONE, KM_PAD_NONE);

  answer begin_raw(const bytes& body, std::size_t capacity = 256) {
    return client().call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, 0, body, capacity);
  }

  std::vector<std::uint32_t> fill_the_pool() {
    std::vector<std::uint32_t> handles(16);
    for (std::uint32_t& handle : handles) handle = client().must_begin(KM_PURPOSE_VERIFY, blob, raw);
    return handles;
  }

  /// expect_refused begins with `params` and expects the failure, with no handle.
  void expect_refused(const failure& expected, std::uint32_t purpose, const bytes& key, const param_list& params) {
    const answer a = expect_failure(expected, [&] { return client().begin(purpose, key, params); });
    EXPECT_EQ(a.b, 0U);
  }
  void expect_refused(const failure& expected, const bytes& body, std::size_t capacity = 256) {
    const answer a = expect_failure(expected, [&] { return begin_raw(body, capacity); });
    EXPECT_EQ(a.b, 0U);
    EXPECT_EQ(a.output, bytes(capacity, canary));
  }
};

TEST_F(BeginTest, AnOperationComesWithAHandleAndAnEmptySetOfParameters) {
  const answer a = succeeds([&] { return client().begin(KM_PURPOSE_SIGN, blob, raw); });
  EXPECT_NE(a.b, 0U);
  EXPECT_EQ(a.body(), u32(0));
  EXPECT_TRUE(client().abort(a.b).ok());
}

TEST_F(BeginTest, AbortGivesBackAllThatBeginTook) {
  const hosted_tee::accounting before = tee.accounting();
  for (const param_list& scheme : {raw, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN)}) {
    for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
      const std::uint32_t handle = client().must_begin(purpose, blob, scheme);
      EXPECT_GT(tee.accounting().operations, before.operations);
      EXPECT_TRUE(client().abort(handle).ok());
      expect_same(before);
    }
  }
}

TEST_F(BeginTest, TheResponseNeedsFourBytesAlsoForNoParameters) {
  const bytes body = join({prefixed(blob), prefixed(raw.marshal())});
  for (const std::size_t capacity : {0U, 1U, 3U}) {
    expect_refused(broken(TEEC_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"}), body, capacity);
  }
  EXPECT_TRUE(begin_raw(body, 4).ok());
}

TEST_F(BeginTest, AFailureBehindThePoolLeavesItsSlotFree) {
  const bytes body = join({prefixed(blob), prefixed(raw.marshal())});
  for (int i = 0; i < 20; ++i) (void)begin_raw(body, 0);
  EXPECT_TRUE(client().begin(KM_PURPOSE_SIGN, blob, raw).ok());
}

TEST_F(BeginTest, ARequestThatEndsInsideAFieldIsRefused) {
  const bytes whole = join({prefixed(blob), prefixed(raw.marshal())});
  const failure expected = broken(TEEC_ERROR_GENERIC, {"Too short input"});
  for (const std::size_t size : {std::size_t{0}, std::size_t{3}, std::size_t{4}, blob.size() + 3, blob.size() + 4,
                                 blob.size() + 7, whole.size() - 1}) {
    SCOPED_TRACE(size);
    expect_refused(expected, bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)));
  }
  expect_refused(expected, join({u32(0xFFFFFFFF), whole}));
  expect_refused(expected, join({prefixed(blob), u32(0xFFFFFFFF), raw.marshal()}));
}

TEST_F(BeginTest, ParametersThatDontUnmarshalAreRefusedBeforeTheBlobIsOpened) {
  const failure expected = broken(TEEC_ERROR_BAD_PARAMETERS, {"Too short input", "Unmarshal failed"});
  expect_refused(expected, join({prefixed(blob), prefixed(bytes{})}));  // no bytes are no empty set
  expect_refused(expected, join({prefixed(blob), prefixed(bytes(3))}));
  expect_refused(expected, join({prefixed(bytes{}), prefixed(u32(1))}));
}

TEST_F(BeginTest, TheBlobIsOpenedBeforeTheApplicationIsLookedAt) {
  const param_list with_id = signature(0, 1).add_blob(KM_TAG_APPLICATION_ID, from_text("x"));
  expect_refused(refused(KM_ERROR_INVALID_KEY_BLOB, {"Too short key blob", "Open key failed"}), KM_PURPOSE_SIGN,
                 bytes(5), with_id);
  expect_refused(refused(KM_ERROR_INVALID_KEY_BLOB, {"KM_TAG_APPLICATION_ID mismatch", "Wrong AppId or AppData"}),
                 KM_PURPOSE_SIGN, blob, with_id);
}

TEST_F(BeginTest, TheApplicationIsLookedAtBeforeThePolicy) {
  const bytes expired = import_fixed(512, rsa_key(512).add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, 1));
  expect_refused(refused(KM_ERROR_INVALID_KEY_BLOB, {"KM_TAG_APPLICATION_DATA mismatch", "Wrong AppId or AppData"}),
                 KM_PURPOSE_SIGN, expired, signature(0, 1).add_blob(KM_TAG_APPLICATION_DATA, from_text("x")));
  expect_refused(refused(KM_ERROR_KEY_EXPIRED, {"Key expired", "Authorization failed"}), KM_PURPOSE_SIGN, expired, raw);
}

TEST_F(BeginTest, ThePolicyIsLookedAtBeforeTheScheme) {
  const bytes for_verifying = import_fixed(512, rsa_key(512).remove(KM_TAG_PURPOSE).add(KM_TAG_PURPOSE, 3));
  expect_refused(refused(KM_ERROR_INCOMPATIBLE_PURPOSE, {"No such purpose in key_params", "Authorization failed"}),
                 KM_PURPOSE_SIGN, for_verifying, {});
}

TEST_F(BeginTest, PurposesThatNobodyServesAreRefused) {
  for (const std::uint32_t purpose : {4U, 0x80000002U, 0xFFFFFFFFU}) {
    expect_refused(refused(KM_ERROR_UNSUPPORTED_PURPOSE, {"Authorization failed"}), purpose, blob, raw);
  }
}

TEST_F(BeginTest, APurposeWithoutAConstructorIsNamedInTheRefusal) {
  const bytes pair = client().must_import(ec_key(256), ec_test_key::of_bits(256).material());
  expect_refused(refused(KM_ERROR_UNSUPPORTED_PURPOSE, {"Algorithm EC purpose 0 not implemented"}), KM_PURPOSE_ENCRYPT,
                 pair, raw);
}

TEST_F(BeginTest, AKeyThatNeedsATokenForEachOperationBegins) {
  const bytes bound = import_fixed(
      512, rsa_key(512).remove(KM_TAG_NO_AUTH_REQUIRED).add(KM_TAG_USER_SECURE_ID, 77).add(KM_TAG_USER_AUTH_TYPE, 1));
  tee.clear_trace();
  const answer a = client().begin(KM_PURPOSE_SIGN, bound, raw);
  EXPECT_TRUE(a.ok());
  EXPECT_NE(a.b, 0U);
  EXPECT_EQ(lines(), (trace_lines{"OP AUTH NEEDED"}));
}

TEST_F(BeginTest, TheNeedOfATokenIsForgottenWhenTheConstructorFails) {
  const bytes bound = import_fixed(
      512, rsa_key(512).remove(KM_TAG_NO_AUTH_REQUIRED).add(KM_TAG_USER_SECURE_ID, 77).add(KM_TAG_USER_AUTH_TYPE, 1));
  tee.world().faults().fail_call("TEE_AllocateOperation", 3, TEE_ERROR_NOT_SUPPORTED);
  expect_refused(broken(TEEC_ERROR_NOT_SUPPORTED,
                        {"OP AUTH NEEDED", "AllocateOperation failed with 0xffff000a\n", "Create operation failed"}),
                 KM_PURPOSE_SIGN, bound, raw);
}

TEST_F(BeginTest, TheSeventeenthOperationIsRefusedUntilOneEnds) {
  const std::vector<std::uint32_t> handles = fill_the_pool();
  EXPECT_EQ(std::set<std::uint32_t>(handles.begin(), handles.end()).size(), 16U);
  expect_refused(refused(KM_ERROR_TOO_MANY_OPERATIONS, {"Too many operations", "Allocate in operation pool failed"}),
                 KM_PURPOSE_VERIFY, blob, raw);
  for (const std::uint32_t handle : handles) EXPECT_TRUE(client().update(handle, bytes{1}).ok());
  EXPECT_TRUE(client().abort(handles.at(7)).ok());
  const std::uint32_t next = client().must_begin(KM_PURPOSE_VERIFY, blob, raw);
  EXPECT_EQ(std::count(handles.begin(), handles.end(), next), 0);
  EXPECT_FALSE(client().begin(KM_PURPOSE_VERIFY, blob, raw).ok());
}

TEST_F(BeginTest, ARefusedSeventeenthBeginHasUsedUpAUse) {
  const bytes limited = import_fixed(512, rsa_key(512).add(KM_TAG_MAX_USES_PER_BOOT, 1));
  const std::vector<std::uint32_t> handles = fill_the_pool();
  EXPECT_EQ(client().begin(KM_PURPOSE_SIGN, limited, raw).error, KM_ERROR_TOO_MANY_OPERATIONS);
  EXPECT_TRUE(client().abort(handles.front()).ok());
  expect_refused(refused(KM_ERROR_KEY_MAX_OPS_EXCEEDED, {"Key max ops exceeded", "Authorization failed"}),
                 KM_PURPOSE_SIGN, limited, raw);
}

TEST_F(BeginTest, EachPlatformFailureHasItsLinesAndItsResult) {
  struct platform_failure {
    const char* call;
    std::uint32_t n;  // of begin's calls of that function
    trace_lines lines;
  };
  const std::string code = " failed with 0xffff0001\n", open = "Open key failed", create = "Create operation failed",
                    resolve = "Resolve key data failed", derive = "DeriveKK" + code;
  const std::vector<platform_failure> rows = {
      {"TEE_AllocateOperation", 1, {"AllocateOperation" + code, derive, open}},
      {"TEE_SetOperationKey", 1, {"SetOperationKey" + code, derive, open}},
      {"TEE_MACComputeFinal", 1, {"MACComputeFinal" + code, derive, open}},
      {"TEE_AllocateTransientObject", 1, {"AllocateTransientObject" + code, derive, open}},
      {"TEE_PopulateTransientObject", 1, {"PopulateTransientObject" + code, derive, open}},
      {"TEE_AllocateOperation", 2, {"AllocateOperation" + code, open}},
      {"TEE_SetOperationKey", 2, {"SetOperationKey" + code, open}},
      {"TEE_AEInit", 1, {"AEInit" + code, open}},
      {"TEE_AEUpdate", 1, {"AEUpdate" + code, open}},
      {"TEE_AEDecryptFinal", 1, {"AEDecryptFinal" + code, open}},
      {"TEE_AllocateTransientObject", 2, {"AllocateTransientObject" + code, resolve, create}},
      {"TEE_PopulateTransientObject", 2, {"PopulateTransientObject" + code, resolve, create}},
      {"TEE_AllocateOperation", 3, {"AllocateOperation" + code, create}},
      {"TEE_AllocateOperation", 4, {"AllocateOperation" + code, create}},
      {"TEE_SetOperationKey", 3, {"SetOperationKey" + code, create}},
  };
  const param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  for (const platform_failure& row : rows) {
    for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
      SCOPED_TRACE(fmt::format("{} number {}", row.call, row.n));
      tee.world().faults().fail_call(row.call, row.n, TEE_ERROR_ACCESS_DENIED);
      expect_refused(broken(TEEC_ERROR_ACCESS_DENIED, row.lines), purpose, blob, scheme);
    }
  }
}

}  // namespace
}  // namespace testing_support
