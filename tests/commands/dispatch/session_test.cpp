// Sessions: whom the TA lets in, and what its one instance shares between them.
#include "tests/commands/command_fixture.h"
#include "tests/commands/dispatch/command_rows.h"

using namespace keymaster;

namespace testing_support {
namespace {

class SessionTest : public CommandTest {};

TEST_F(SessionTest, EveryClientAndEveryParameterLayoutIsAccepted) {
  for (const std::uint32_t login : {TEE_LOGIN_PUBLIC, TEE_LOGIN_USER, TEE_LOGIN_APPLICATION, TEE_LOGIN_TRUSTED_APP}) {
    for (const std::uint32_t types : {0U, values_only, with_both, request_only, 0x7777U}) {
      bytes buffer = pattern(8);
      TEE_Param params[4] = {memref(buffer), memref(buffer), memref(buffer), memref(buffer)};
      TEE_Identity who = {};
      who.login = login;
      std::uint32_t session = 0, origin = 0;
      EXPECT_EQ(tee.world().open_session(keymaster_ta, who, types, params, session, origin), TEE_SUCCESS);
      EXPECT_EQ(buffer, pattern(8));
      tee.world().close_session(session);
    }
  }
}

TEST_F(SessionTest, OpeningAndClosingTracesNothingAndHoldsNothing) {
  const hosted_tee::accounting before = tee.accounting();
  tee.clear_trace();
  (void)tee.another_client();
  EXPECT_TRUE(tee.world().trace().lines().empty());
  expect_same(before);
}

TEST_F(SessionTest, TheInstanceEndsWithItsLastSession) {
  auto second = tee.another_client();
  tee.close_session();
  EXPECT_TRUE(tee.world().has_instance(keymaster_ta));
  second.reset();
  EXPECT_FALSE(tee.world().has_instance(keymaster_ta));
}

TEST_F(SessionTest, AnOperationOfOneSessionIsValidInAnother) {
  const bytes blob = import_fixed(1024);
  const auto second = tee.another_client();
  const std::uint32_t handle =
      client().must_begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN));
  EXPECT_TRUE(second->update(handle, from_text("across ")).ok());
  EXPECT_TRUE(client().update(handle, from_text("sessions")).ok());
  const finish_answer done = second->finish(handle);
  EXPECT_TRUE(done.ok());
  EXPECT_TRUE(rsa_test_key::of_bits(1024).verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN,
                                                   from_text("across sessions"), done.data));
}

TEST_F(SessionTest, AnOperationOutlivesTheSessionThatBeganIt) {
  const bytes blob = import_fixed(1024);
  const auto second = tee.another_client();
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE));
  tee.close_session();
  EXPECT_TRUE(second->update(handle, from_text("still here")).ok());
  EXPECT_TRUE(second->finish(handle).ok());
}

TEST_F(SessionTest, OperationsDieWithTheLastSessionAndBlobsDoNot) {
  const bytes blob = import_fixed(1024);
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE));
  tee.close_session();
  tee.open_session();
  EXPECT_EQ(client().update(handle, from_text("too late")).error, KM_ERROR_INVALID_OPERATION_HANDLE);
  EXPECT_TRUE(client().characteristics(blob).ok());
}

TEST_F(SessionTest, UseCountsDieWithTheLastSession) {
  const bytes blob = import_fixed(1024, rsa_key(1024).add(KM_TAG_MAX_USES_PER_BOOT, 1));
  const param_list raw = signature(KM_DIGEST_NONE, KM_PAD_NONE);
  const auto keeps_it_alive = [&] { return tee.another_client(); };
  auto second = keeps_it_alive();
  (void)client().abort(client().must_begin(KM_PURPOSE_SIGN, blob, raw));
  tee.close_session();
  tee.open_session();
  EXPECT_EQ(client().begin(KM_PURPOSE_SIGN, blob, raw).error, KM_ERROR_KEY_MAX_OPS_EXCEEDED);
  second.reset();
  tee.close_session();
  tee.open_session();
  EXPECT_TRUE(client().begin(KM_PURPOSE_SIGN, blob, raw).ok());
}

}  // namespace
}  // namespace testing_support
