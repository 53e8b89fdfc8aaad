// What the log says of a platform that fails on the way to a statement: the text and the level.
#include "soter/soter_init.h"
#include "tests/soter/statement_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

using text_lines = std::vector<std::string>;

constexpr TEE_Result platform_failure = 0xF0001234;

class SoterMessagesTest : public SoterStatementTest {
 protected:
  void load() { ASSERT_EQ(soter_ensure_ready(), TEE_SUCCESS); }

  const param_list by_attk =
      param_list{}.add(KM_TAG_SOTER_COUNTED).add(KM_TAG_SOTER_UID, 7).add(KM_TAG_SOTER_SIGNED_BY_ATTK);
};

TEST_F(SoterMessagesTest, EveryPlatformCallOfAnExportThatFailsIsTold) {
  load();
  ASSERT_EQ(export_key(by_attk).result, TEE_SUCCESS);  // creates the counter
  struct row {
    const char* call;
    std::uint32_t n;
    TEE_Result result;
    text_lines lines;
  };
  const std::string no_key = "Sign key is null\n", no_pem = "export public key error\n",
                    not_digested = "digest message error 0xf0001234\n", not_signed = "sign degist error 0xf0001234\n",
                    no_signature = "sign data error 0xf0001234\n";
  // The second object is the attestation key; of the operations the first exports, the second digests, the third signs.
  const row rows[] = {
      {"TEE_AllocateTransientObject",
       2,
       TEE_ERROR_BAD_STATE,
       {"TEE_AllocateTransientObject failed: f0001234\n", no_key}},
      {"TEE_PopulateTransientObject",
       2,
       TEE_ERROR_BAD_STATE,
       {"TEE_PopulateTransientObject failed: f0001234\n", no_key}},
      {"TEE_AllocateOperation", 1, platform_failure, {"TEE_AllocateOperation failed: f0001234\n", no_pem}},
      {"TEE_SetOperationKey", 1, platform_failure, {"TEE_SetOperationKey failed: f0001234\n", no_pem}},
      {"TEE_AsymmetricExport", 1, platform_failure, {"TEE_AsymmetricExport failed: f0001234\n", no_pem}},
      {"TEE_AllocateOperation",
       2,
       platform_failure,
       {"TEE_AllocateOperation failed: f0001234\n", not_digested, no_signature}},
      {"TEE_DigestDoFinal", 1, platform_failure, {"TEE_DigestDoFinal failed: f0001234\n", not_digested, no_signature}},
      {"TEE_AllocateOperation",
       3,
       platform_failure,
       {"TEE_AllocateOperation failed: f0001234\n", not_signed, no_signature}},
      {"TEE_SetOperationKey",
       2,
       platform_failure,
       {"TEE_SetOperationKey failed: f0001234\n", not_signed, no_signature}},
      {"TEE_AsymmetricSignDigest",
       1,
       platform_failure,
       {"TEE_AsymmetricSignDigest failed: f0001234\n", not_signed, no_signature}},
      {"TEE_ReadObjectData", 1, platform_failure, {"increase counter error f0001234\n"}},
      {"TEE_SeekObjectData",
       1,
       platform_failure,
       {"seek pos to the beginning error\n", "increase counter error f0001234\n"}},
  };
  const hosted_tee::accounting before = ta().holdings();
  for (const row& each : rows) {
    SCOPED_TRACE(each.call);
    just_before = [&] { faults().clear(), faults().fail_call(each.call, each.n, platform_failure); };
    expect_export_fails(export_key(by_attk), each.result, each.lines);
    expect_same(ta().holdings(), before);
  }
}

TEST_F(SoterMessagesTest, ASignerAboveTheAttestationKeysSizeHasNoRoomForItsSignature) {
  const bytes signer = blob(key_data(3072));
  const param_list key = param_list{}.add(KM_TAG_SOTER_SIGNED_BY_KEY).add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, signer);
  expect_export_fails(export_key(key), TEE_ERROR_SHORT_BUFFER,
                      {"TEE_AsymmetricSignDigest failed: ffff0010\n", "sign degist error 0xffff0010\n",
                       "sign data error 0xffff0010\n"});
}

TEST_F(SoterMessagesTest, AKeyWhosePublicHalfHasNoRoomAsTextIsNotExported) {
  // 806 bytes of DER fit into 1024, and 1076 characters don't.
  EXPECT_EQ(rsa_test_key::of_bits(6144).spki().size(), 806U);
  expect_export_fails(export_key(by_attk, key_data(6144)), TEE_ERROR_SHORT_BUFFER, {"export public key error\n"});
  EXPECT_EQ(stored_counter(), u64(1));
}

TEST_F(SoterMessagesTest, WhereTheSignerWasFoundIsTold) {
  const bytes signer = blob(key_data(1024));
  const param_list key = param_list{}.add(KM_TAG_SOTER_SIGNED_BY_KEY);
  for (const auto& [tag, line] :
       {std::pair{KM_TAG_SOTER_SIGNING_KEY_BLOB, "use key blob argument to retrieve sign key\n"},
        std::pair{KM_TAG_SOTER_SIGNING_KEY_NAME, "use key name argument as key blob to retrieve sign key\n"}}) {
    EXPECT_EQ(export_key(param_list(key).add_blob(tag, signer)).result, TEE_SUCCESS);
    text_lines told = ta().traced(trace_level::debug);
    ASSERT_GT(told.size(), 2U) << "opening the signer has more to say";
    told.resize(2);
    EXPECT_THAT(told, ElementsAre("soter use normal key sign\n", line));
    EXPECT_THAT(errors(), IsEmpty());
  }
}

TEST_F(SoterMessagesTest, ACounterThatCantBeReadFailsASignature) {
  load();
  store_counter(bytes(8));
  just_before = [&] { faults().clear(), faults().fail_call("TEE_ReadObjectData", 1, platform_failure); };
  EXPECT_EQ(sign_once("x").result, platform_failure);
  EXPECT_THAT(errors(), ElementsAre("increase counter error f0001234\n", "produce json string error"));
}

}  // namespace
}  // namespace testing_support
