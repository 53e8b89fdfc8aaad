// Memory references without memory, and slots that share theirs.
#include "tests/commands/command_fixture.h"
#include "tests/commands/raw_session.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// A null buffer is empty, whatever size comes with it.
class NullSlotTest : public CommandTest {
 protected:
  raw_session session{tee.world()};
  bytes room = bytes(8192, canary);

  void expect_failed(const raw_answer& got, TEE_Result result, const trace_lines& expected) {
    EXPECT_EQ(got.result, result);
    EXPECT_EQ(got.error, KM_ERROR_UNKNOWN_ERROR);
    EXPECT_EQ(got.size, 0U);
    EXPECT_EQ(lines(), expected);
    tee.clear_trace();
  }

  void SetUp() override { tee.clear_trace(); }
};

TEST_F(NullSlotTest, ANullRequestIsTooShortForEveryCommandThatReadsOne) {
  const hosted_tee::accounting before = tee.accounting();
  expect_failed(session.call(KM_COMMAND_GENERATE_KEY, 0, null_memref(100), memref(room)), TEE_ERROR_BAD_PARAMETERS,
                {"Too short input", "Unmarshal failed"});
  for (const std::uint32_t command :
       {KM_COMMAND_GET_KEY_CHARACTER, KM_COMMAND_IMPORT_KEY, KM_COMMAND_EXPORT_KEY, KM_COMMAND_BEGIN}) {
    SCOPED_TRACE(command);
    expect_failed(session.call(command, 0, null_memref(100), memref(room)), TEE_ERROR_GENERIC, {"Too short input"});
  }
  for (const std::uint32_t command : {KM_COMMAND_GET_KEY_CHARACTER_SIZE, KM_COMMAND_DELETE_KEY}) {
    SCOPED_TRACE(command);
    TEE_Param params[4] = {values(0, 0), null_memref(100), {}, {}};
    EXPECT_EQ(session.invoke(command, with_request, params), TEE_ERROR_GENERIC);
    EXPECT_EQ(static_cast<std::int32_t>(params[0].value.a), KM_ERROR_UNKNOWN_ERROR);
    EXPECT_EQ(params[0].value.b, 0U);
  }
  expect_same(before);
}

TEST_F(NullSlotTest, ANullRequestEndsTheOperationItIsSentTo) {
  const bytes blob = import_fixed(1024);
  const hosted_tee::accounting before = tee.accounting();
  for (const std::uint32_t command : {KM_COMMAND_UPDATE, KM_COMMAND_FINISH}) {
    SCOPED_TRACE(command);
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE));
    tee.clear_trace();
    expect_failed(session.call(command, handle, null_memref(8), memref(room)), TEE_ERROR_GENERIC, {"Too short input"});
    expect_same(before);
    EXPECT_EQ(client().abort(handle).error, KM_ERROR_INVALID_OPERATION_HANDLE);
  }
}

TEST_F(NullSlotTest, ANullResponseHasNoRoomForAKey) {
  bytes params = rsa_key(512).marshal();
  expect_failed(session.call(KM_COMMAND_GENERATE_KEY, 0, memref(params), null_memref(4096)), TEE_ERROR_SHORT_BUFFER,
                {"Too short key blob", "Can't save key to TEE storage"});
  bytes request = join({prefixed(rsa_key(512).marshal()), rsa_test_key::of_bits(512).material()});
  expect_failed(session.call(KM_COMMAND_IMPORT_KEY, 0, memref(request), null_memref(4096)), TEE_ERROR_GENERIC,
                {"Too short input"});
}

TEST_F(NullSlotTest, ANullResponseHasNoRoomForWhatIsKnownOfAKey) {
  bytes request = key_body(import_fixed(512), {}, {});
  tee.clear_trace();
  expect_failed(session.call(KM_COMMAND_GET_KEY_CHARACTER, 0, memref(request), null_memref(4096)),
                TEE_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"});
  const raw_answer exported = session.call(KM_COMMAND_EXPORT_KEY, 0, memref(request), null_memref(4096));
  EXPECT_EQ(exported.result, TEE_SUCCESS);
  EXPECT_EQ(exported.error, KM_ERROR_UNKNOWN_ERROR);
  EXPECT_EQ(exported.size, 0U);
  EXPECT_EQ(lines(), (trace_lines{"TEE_AsymmetricExport failed: ffff0010\n", "Export key failed"}));
}

TEST_F(NullSlotTest, ANullResponseFailsBeginAndLosesFinish) {
  const bytes blob = import_fixed(512);
  const hosted_tee::accounting before = tee.accounting();
  const param_list raw = signature(KM_DIGEST_NONE, KM_PAD_NONE);
  bytes request = join({prefixed(blob), prefixed(raw.marshal())});
  tee.clear_trace();
  expect_failed(session.call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, memref(request), null_memref(4096)),
                TEE_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"});
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, raw);
  bytes empty = join({prefixed(bytes{}), prefixed(param_list{}.marshal())});
  tee.clear_trace();
  expect_failed(session.call(KM_COMMAND_FINISH, handle, memref(empty), null_memref(4096)), TEE_ERROR_GENERIC,
                {"Too short input"});
  expect_same(before);
}

TEST_F(NullSlotTest, ANullListIsAnEmptyOne) {
  TEE_Param params[4] = {values(KM_ALGORITHM_RSA, KM_PURPOSE_SIGN), {}, null_memref(12), {}};
  EXPECT_EQ(session.invoke(KM_COMMAND_GET_SUPPORT_PADDING_MODE, with_response, params), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(lines(), (trace_lines{"Output buffer doesn't match"}));
  EXPECT_EQ(params[2].memref.size, 12U);
  params[0] = values(KM_ALGORITHM_RSA, KM_PURPOSE_SIGN);  // RSA has no block modes, and an empty list holds them all
  EXPECT_EQ(session.invoke(KM_COMMAND_GET_SUPPORT_BLK_MODE, with_response, params), TEE_SUCCESS);
  EXPECT_EQ(params[0].value.a, 0U);
  params[0] = values(0, 0);
  params[2] = null_memref(16);
  EXPECT_EQ(session.invoke(KM_COMMAND_GET_SUPPORT_ALGO, with_response, params), TEE_ERROR_BAD_PARAMETERS);
}

/// A client may give one buffer for request and response: what is written must not spoil what is read.
class SharedSlotTest : public CommandTest {
 protected:
  raw_session session{tee.world()};
  const rsa_test_key& key = rsa_test_key::of_bits(1024);

  /// call_in_place sends `request` in a buffer that takes the response as well.
  bytes call_in_place(std::uint32_t command, std::uint32_t a, bytes request, std::uint32_t* b = nullptr) {
    const auto used = static_cast<std::uint32_t>(request.size());
    request.resize(8192);
    TEE_Param in = memref(request);
    in.memref.size = used;
    const raw_answer got = session.call(command, a, in, memref(request));
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.error, KM_ERROR_OK);
    if (b != nullptr) *b = got.b;
    request.resize(got.size);
    return request;
  }
};

TEST_F(SharedSlotTest, AKeyGoesItsWholeWayInOneSharedBuffer) {
  const bytes imported =
      call_in_place(KM_COMMAND_IMPORT_KEY, 0, join({prefixed(rsa_key(1024).marshal()), key.material()}));
  const bytes blob(imported.begin() + 4, imported.begin() + 4 + u32_at(imported, 0));
  EXPECT_EQ(call_in_place(KM_COMMAND_EXPORT_KEY, 0, key_body(blob, {}, {})), key.spki());
  EXPECT_EQ(call_in_place(KM_COMMAND_GET_KEY_CHARACTER, 0, key_body(blob, {}, {})),
            client().characteristics(blob).body());

  const param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS);
  const bytes message = pattern(3000), empty = param_list{}.marshal();
  std::uint32_t handle = 0, consumed = 0;
  (void)call_in_place(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, join({prefixed(blob), prefixed(scheme.marshal())}), &handle);
  (void)call_in_place(KM_COMMAND_UPDATE, handle, join({prefixed(message), prefixed(empty)}), &consumed);
  EXPECT_EQ(consumed, message.size());
  const bytes done = call_in_place(KM_COMMAND_FINISH, handle, join({prefixed(bytes{}), prefixed(empty)}));
  ASSERT_EQ(u32_at(done, 0), key.size());
  EXPECT_TRUE(key.verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS, message,
                           {done.begin() + 4, done.begin() + 4 + static_cast<std::ptrdiff_t>(key.size())}));
}

TEST_F(SharedSlotTest, AGeneratedKeyMayReplaceItsOwnParameters) {
  const bytes blob = call_in_place(KM_COMMAND_GENERATE_KEY, 0, rsa_key(512).marshal());
  EXPECT_TRUE(client().characteristics(blob).ok());
}

}  // namespace
}  // namespace testing_support
