// Keys of the soter framework while the device's soter resources can't be had, and the framework's own commands.
#include "tests/commands/command_fixture.h"
#include "tests/commands/dispatch/command_rows.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/encryption.h"
#include "tests/support/hmac_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;

class SoterKeyTest : public CommandTest {
 protected:
  /// The Keymaster TA runs already; no other TA is found on this device.
  SoterKeyTest() { tee.world().device().ta_folders.clear(); }

  const param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS);

  /// The keys that carry the tag: the value counts for nothing, its presence for everything.
  std::vector<bytes> soter_keys() {
    return {client().must_generate(rsa_key(512).add(KM_TAG_SOTER_KEY)),
            import_fixed(1024, rsa_key(1024).add(KM_TAG_SOTER_KEY)),
            import_fixed(1024, rsa_key(1024).add(KM_TAG_SOTER_KEY, 0))};
  }
};

TEST_F(SoterKeyTest, SigningNeedsTheSoterResources) {
  for (const bytes& blob : soter_keys()) {
    expect_failure(refused(KM_ERROR_UNKNOWN_ERROR,
                           {"Open quil session fails, 0xffff0008\n", "soter resources is not ready, error 0xffff0008\n",
                            "Create operation failed"}),
                   [&] { return client().begin(KM_PURPOSE_SIGN, blob, scheme); });
    EXPECT_TRUE(tee.traced("sign from soter, allocate raw message buffer", trace_level::debug));
  }
}

TEST_F(SoterKeyTest, TheResourcesAreAskedForBeforeTheSchemeIsLookedAt) {
  const bytes blob = import_fixed(1024, rsa_key(1024).add(KM_TAG_SOTER_KEY));
  expect_failure(
      refused(KM_ERROR_UNKNOWN_ERROR, {"Open quil session fails, 0xffff0008\n",
                                       "soter resources is not ready, error 0xffff0008\n", "Create operation failed"}),
      [&] { return client().begin(KM_PURPOSE_SIGN, blob, {}); });
}

TEST_F(SoterKeyTest, ExportIsAStatementThatNobodySignsUnlessTheKeySaysWho) {
  for (const bytes& blob : soter_keys()) {
    expect_failure(broken(TEEC_ERROR_BAD_PARAMETERS, {}), [&] { return client().export_key(blob); });
    EXPECT_TRUE(tee.traced("soter export_key\n", trace_level::debug));
    EXPECT_FALSE(tee.traced("normal export_key\n", trace_level::debug));
  }
}

TEST_F(SoterKeyTest, KeysOfOtherAlgorithmsAreExportedByTheFrameworkTooWhichKnowsRsaAlone) {
  struct row {
    const char* algorithm;
    bytes blob;
    trace_lines errors;
  };
  const auto tagged = [](param_list key) { return key.add(KM_TAG_SOTER_KEY).add(KM_TAG_SOTER_SIGNED_BY_ATTK); };
  const std::string unresolved = "resolve key from data stream error\n";
  const row rows[] = {
      {"AES", client().must_import(tagged(aes_key(256)), bytes(32)), {unresolved}},
      {"EC", client().must_generate(tagged(ec_key(256))), {"Too short input", unresolved}},
      {"HMAC",
       client().must_import(tagged(hmac_key(KM_DIGEST_SHA_2_256, 256)), pattern(32)),
       {"Too short input", unresolved}},
  };
  for (const row& each : rows) {
    SCOPED_TRACE(each.algorithm);
    expect_failure(broken(TEEC_ERROR_BAD_FORMAT, each.errors), [&] { return client().export_key(each.blob); });
    EXPECT_TRUE(tee.traced("soter export_key\n", trace_level::debug));
    EXPECT_FALSE(tee.traced("normal export_key\n", trace_level::debug));
  }
}

TEST_F(SoterKeyTest, ExportUnderTheAttestationKeyNeedsTheSoterResources) {
  const bytes blob = import_fixed(1024, rsa_key(1024).add(KM_TAG_SOTER_KEY).add(KM_TAG_SOTER_SIGNED_BY_ATTK));
  expect_failure(broken(TEEC_ERROR_ITEM_NOT_FOUND, {"Open quil session fails, 0xffff0008\n", "soter is not ready\n"}),
                 [&] { return client().export_key(blob); });
}

TEST_F(SoterKeyTest, VerifyingIsAsWithAnyKey) {
  const bytes blob = import_fixed(1024, rsa_key(1024).add(KM_TAG_SOTER_KEY));
  const bytes message = from_text("statement");
  const bytes made = rsa_test_key::of_bits(1024).sign(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS, message);
  EXPECT_TRUE(client().verify(blob, scheme, message, made).ok());
}

TEST_F(SoterKeyTest, TheTagInTheBeginParametersMeansNothing) {
  const param_list tagged = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS).add(KM_TAG_SOTER_KEY);
  EXPECT_TRUE(client().sign(import_fixed(1024), tagged, from_text("message")).ok());
}

TEST_F(SoterKeyTest, TheFrameworksCommandsTellThatTheProvisioningTaIsAbsent) {
  struct row {
    std::uint32_t command;
    std::int32_t status;
    trace_lines errors;
  };
  const std::string no_session = "Open quil session fails, 0xffff0008\n";
  const row rows[] = {
      {KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR,
       KM_ERROR_UNKNOWN_ERROR,
       {no_session, "attk_key_pair is not produced\n"}},
      {KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR, SOTER_STATUS_NO_ATTK, {no_session}},
      {KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, SOTER_STATUS_NO_ATTK, {no_session}},
      {KM_COMMAND_SOTER_GET_DEVICE_ID,
       KM_ERROR_UNKNOWN_ERROR,
       {no_session, "retrieve_device_id_from_quil fail, 0xffff0008\n"}},
  };
  raw_session session(tee.world());
  for (const row& expected : rows) {
    const auto entry = std::find_if(command_rows.begin(), command_rows.end(),
                                    [&](const command_row& each) { return each.id == expected.command; });
    ASSERT_NE(entry, command_rows.end());
    SCOPED_TRACE(entry->name);
    bytes response(64, canary);
    TEE_Param params[4] = {values(0, 0), {}, memref(response), {}};
    const hosted_tee::accounting before = tee.accounting();
    tee.clear_trace();
    EXPECT_EQ(session.invoke(entry->id, entry->types, params), TEE_SUCCESS);
    EXPECT_EQ(static_cast<std::int32_t>(params[0].value.a), expected.status);
    EXPECT_EQ(lines(), expected.errors);
    EXPECT_EQ(response, bytes(64, canary));
    expect_same(before);
  }
}

TEST_F(SoterKeyTest, AFingerIdOfTheNormalWorldIsDenied) {
  bytes request(16);
  TEE_Param params[4] = {{}, memref(request), {}, {}};
  raw_session session(tee.world());
  tee.clear_trace();
  EXPECT_EQ(session.invoke(KM_COMMAND_SOTER_SET_FID, TEE_PARAM_TYPES(0, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0), params),
            TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(lines(), trace_lines{"soter deny finger print ta"});
}

TEST_F(SoterKeyTest, GeneratingTheAttestationKeyTakesAnArgument) {
  const answer a = client().call(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR, 0xABCD, 0, std::nullopt, std::nullopt);
  EXPECT_EQ(a.result, TEEC_SUCCESS);
  EXPECT_EQ(a.error, KM_ERROR_UNKNOWN_ERROR);
}

}  // namespace
}  // namespace testing_support
