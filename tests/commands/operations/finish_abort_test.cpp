// finish and abort: how operations end.
#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class FinishTest : public CommandTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(1024);
  const param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const bytes message = from_text("the message");
  const hosted_tee::accounting idle = tee.accounting();

  std::uint32_t begin_and_update(std::uint32_t purpose = KM_PURPOSE_SIGN) {
    const std::uint32_t handle = client().must_begin(purpose, blob, scheme);
    EXPECT_TRUE(client().update(handle, message).ok());
    return handle;
  }
  answer finish_raw(std::uint32_t handle, const bytes& body, std::size_t capacity = 256) {
    return client().call(KM_COMMAND_FINISH, handle, 0, body, capacity);
  }
};

TEST_F(FinishTest, TheResponseIsTheSignatureAndAnEmptySetEachBehindItsLength) {
  const std::uint32_t handle = begin_and_update();
  const finish_answer done = succeeds([&] { return client().finish(handle); });
  expect_same(idle);
  const bytes made = key.sign(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message);
  EXPECT_EQ(to_hex(done.body()), to_hex(join({prefixed(made), prefixed(u32(0))})));
  EXPECT_EQ(bytes(done.output.begin() + done.size, done.output.end()), bytes(done.output.size() - done.size, canary));
  EXPECT_EQ(client().finish(handle).error, KM_ERROR_INVALID_OPERATION_HANDLE);
}

TEST_F(FinishTest, TheInputOfSigningIsNotUsed) {
  const finish_answer done = client().finish(begin_and_update(), from_text("not part of it"));
  EXPECT_EQ(done.data, key.sign(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message));
}

TEST_F(FinishTest, AResponseThatIsTooSmallLosesTheOperation) {
  const std::size_t k = key.size();
  const bytes body = join({prefixed(bytes{}), prefixed(u32(0))});
  for (const std::size_t capacity : {std::size_t{0}, std::size_t{3}, std::size_t{4}, 4 + k - 1, 4 + k, 4 + k + 3}) {
    SCOPED_TRACE(capacity);
    const std::uint32_t handle = begin_and_update();
    (void)expect_lost(broken(TEEC_ERROR_GENERIC, {"Too short input"}), handle, idle,
                      [&] { return finish_raw(handle, body, capacity); });
  }
  for (const std::size_t capacity : {8 + k, 8 + k + 3}) {
    SCOPED_TRACE(capacity);
    const std::uint32_t handle = begin_and_update();
    (void)expect_lost(broken(TEEC_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"}), handle, idle,
                      [&] { return finish_raw(handle, body, capacity); });
  }
  EXPECT_EQ(finish_raw(begin_and_update(), body, 12 + k).size, 12 + k);
}

TEST_F(FinishTest, VerifyingNeedsTwelveBytesOfResponse) {
  const bytes made = key.sign(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message);
  const bytes body = join({prefixed(made), prefixed(u32(0))});
  for (const std::size_t capacity : {0U, 4U, 7U}) {
    const std::uint32_t handle = begin_and_update(KM_PURPOSE_VERIFY);
    (void)expect_lost(broken(TEEC_ERROR_GENERIC, {"Too short input"}), handle, idle,
                      [&] { return finish_raw(handle, body, capacity); });
  }
  const std::uint32_t handle = begin_and_update(KM_PURPOSE_VERIFY);
  (void)expect_lost(broken(TEEC_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"}), handle, idle,
                    [&] { return finish_raw(handle, body, 11); });
  const answer done = succeeds([&] { return finish_raw(begin_and_update(KM_PURPOSE_VERIFY), body, 12); });
  EXPECT_EQ(done.body(), join({u32(0), prefixed(u32(0))}));
}

TEST_F(FinishTest, AnUnknownHandleIsFoundBeforeTheBodyIsRead) {
  const failure expected = refused(KM_ERROR_INVALID_OPERATION_HANDLE, {"Operation handle not found"});
  for (const std::uint32_t handle : {0U, 0x12345678U}) {
    expect_failure(expected, [&] { return finish_raw(handle, bytes(3)); });
    expect_failure(expected, [&] { return finish_raw(handle, join({prefixed(bytes{}), prefixed(u32(0))})); });
  }
}

TEST_F(FinishTest, ABodyThatIsMalformedEndsTheOperation) {
  for (const bytes& body : {bytes{}, bytes(3), u32(1), join({u32(0xFFFFFFFF), bytes(20)}), prefixed(pattern(10)),
                            join({prefixed(pattern(10)), u32(5), u32(0)})}) {
    const std::uint32_t handle = begin_and_update();
    (void)expect_lost(broken(TEEC_ERROR_GENERIC, {"Too short input"}), handle, idle,
                      [&] { return finish_raw(handle, body); });
  }
  for (const bytes& params : {bytes{}, bytes(3), u32(1)}) {
    const std::uint32_t handle = begin_and_update();
    (void)expect_lost(refused(KM_ERROR_INVALID_ARGUMENT, {"Too short input", "Unmarshal failed"}), handle, idle, [&] {
      return finish_raw(handle, join({prefixed(bytes{}), prefixed(params)}));
    });
  }
}

TEST_F(FinishTest, AFailedFinishCantBeRetried) {
  const std::uint32_t handle = begin_and_update(KM_PURPOSE_VERIFY);
  (void)expect_lost(refused(KM_ERROR_VERIFICATION_FAILED, {"Finish failed"}), handle, idle,
                    [&] { return client().finish(handle, bytes(key.size())); });
}

TEST_F(FinishTest, EachPlatformFailureOfSigningHasItsLineAndItsResult) {
  struct platform_failure {
    const char* call;
    const char* line;
  };
  for (const platform_failure& each : {platform_failure{"TEE_DigestDoFinal", "DigestDoFinal failed with 0xffff0001\n"},
                                       {"TEE_AsymmetricSignDigest", "AsymmetricSignDigest failed with 0xffff0001\n"}}) {
    const std::uint32_t handle = begin_and_update();
    tee.world().faults().fail_call(each.call, 1, TEE_ERROR_ACCESS_DENIED);
    (void)expect_lost(broken(TEEC_ERROR_ACCESS_DENIED, {each.line, "Finish failed"}), handle, idle,
                      [&] { return client().finish(handle); });
  }
}

TEST_F(FinishTest, APlatformFailureOfVerifyingIsNoWrongSignature) {
  for (const char* const call : {"TEE_DigestDoFinal", "TEE_AsymmetricVerifyDigest"}) {
    const std::uint32_t handle = begin_and_update(KM_PURPOSE_VERIFY);
    tee.world().faults().fail_call(call, 1, TEE_ERROR_ACCESS_DENIED);
    const hosted_tee::accounting before = idle;
    tee.clear_trace();
    const answer a = client().finish(handle, bytes(key.size()));
    EXPECT_EQ(a.result, TEEC_ERROR_ACCESS_DENIED);
    EXPECT_EQ(a.error, KM_ERROR_UNKNOWN_ERROR);
    EXPECT_TRUE(tee.traced("Finish failed"));
    expect_same(before);
  }
}

class AbortTest : public FinishTest {};

TEST_F(AbortTest, AnAbortedOperationIsGone) {
  const std::uint32_t handle = begin_and_update();
  const answer a = succeeds([&] { return client().abort(handle); });
  EXPECT_EQ(a.b, 0U);
  expect_same(idle);
  EXPECT_EQ(client().update(handle, message).error, KM_ERROR_INVALID_OPERATION_HANDLE);
  EXPECT_EQ(client().finish(handle).error, KM_ERROR_INVALID_OPERATION_HANDLE);
}

TEST_F(AbortTest, TheSecondAbortFindsNothing) {
  const std::uint32_t handle = begin_and_update();
  EXPECT_TRUE(client().abort(handle).ok());
  expect_failure(refused(KM_ERROR_INVALID_OPERATION_HANDLE, {"Operation handle not found"}),
                 [&] { return client().abort(handle); });
}

TEST_F(AbortTest, HandlesThatNeverWereAreNotFound) {
  for (const std::uint32_t handle : {0U, 1U, 0xFFFFFFFFU}) {
    expect_failure(refused(KM_ERROR_INVALID_OPERATION_HANDLE, {"Operation handle not found"}),
                   [&] { return client().abort(handle); });
  }
}

TEST_F(AbortTest, AFinishedOperationCantBeAborted) {
  const std::uint32_t handle = begin_and_update();
  EXPECT_TRUE(client().finish(handle).ok());
  EXPECT_EQ(client().abort(handle).error, KM_ERROR_INVALID_OPERATION_HANDLE);
}

}  // namespace
}  // namespace testing_support
