// Keys of the soter framework while the device's soter resources can't be had, and the framework's own commands.
#include "tests/commands/command_fixture.h"
#include "tests/commands/dispatch/command_rows.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;

class SoterKeyTest : public CommandTest {
 protected:
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
                           {"soter resources is not ready, error 0xffff0009\n", "Create operation failed"}),
                   [&] { return client().begin(KM_PURPOSE_SIGN, blob, scheme); });
    EXPECT_TRUE(tee.traced("sign from soter, allocate raw message buffer", trace_level::debug));
  }
}

TEST_F(SoterKeyTest, TheResourcesAreAskedForBeforeTheSchemeIsLookedAt) {
  const bytes blob = import_fixed(1024, rsa_key(1024).add(KM_TAG_SOTER_KEY));
  expect_failure(
      refused(KM_ERROR_UNKNOWN_ERROR, {"soter resources is not ready, error 0xffff0009\n", "Create operation failed"}),
      [&] { return client().begin(KM_PURPOSE_SIGN, blob, {}); });
}

TEST_F(SoterKeyTest, ExportIsAStatementThatCantBeMade) {
  for (const bytes& blob : soter_keys()) {
    expect_failure(broken(TEEC_ERROR_NOT_IMPLEMENTED, {}), [&] { return client().export_key(blob); });
    EXPECT_TRUE(tee.traced("soter export_key\n", trace_level::debug));
    EXPECT_FALSE(tee.traced("normal export_key\n", trace_level::debug));
  }
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

TEST_F(SoterKeyTest, TheFrameworksCommandsAreNotImplemented) {
  for (const command_row& row : command_rows) {
    if (row.id < 0xFF00) continue;
    SCOPED_TRACE(row.name);
    bytes request = pattern(32), response(64, canary);
    const bool is_set_fid = TEE_PARAM_TYPE_GET(row.types, 0) == TEE_PARAM_TYPE_NONE;
    TEE_Param params[4] = {values(0, 0), memref(request), memref(response), {}};
    if (is_set_fid) params[0] = {};
    raw_session session(tee.world());
    const hosted_tee::accounting before = tee.accounting();
    EXPECT_EQ(session.invoke(row.id, row.types, params), TEE_ERROR_NOT_IMPLEMENTED);
    expect_same(before);
    EXPECT_EQ(response, bytes(64, canary));
  }
}

TEST_F(SoterKeyTest, GeneratingTheAttestationKeyTakesAnArgument) {
  const answer a = client().call(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR, 0xABCD, 0, std::nullopt, std::nullopt);
  EXPECT_EQ(a.result, TEEC_ERROR_NOT_IMPLEMENTED);
}

}  // namespace
}  // namespace testing_support
