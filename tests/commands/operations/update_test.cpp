// update: its request, and how a failure takes the operation with it.
#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class UpdateTest : public CommandTest {
 protected:
  const bytes blob = import_fixed(1024);
  const param_list raw = signature(KM_DIGEST_NONE, KM_PAD_NONE);
  const param_list with_digest = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);

  answer update_raw(std::uint32_t handle, const bytes& body) {
    return client().call(KM_COMMAND_UPDATE, handle, 0, body, std::size_t{64});
  }

  /// expect_lost sends `body` to a fresh operation and expects the failure, the consumed count, and the operation gone.
  void expect_lost_by(const failure& expected, std::uint32_t consumed, const bytes& body) {
    const hosted_tee::accounting before = tee.accounting();
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, raw);
    const answer a = expect_lost(expected, handle, before, [&] { return update_raw(handle, body); });
    EXPECT_EQ(a.b, consumed);
    EXPECT_EQ(a.output, bytes(64, canary));
  }
};

TEST_F(UpdateTest, InputIsConsumedWholeAndGivesNoOutput) {
  for (const param_list& scheme : {raw, with_digest}) {
    for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
      const std::uint32_t handle = client().must_begin(purpose, blob, scheme);
      const hosted_tee::accounting before = tee.accounting();
      for (const std::size_t size : {0U, 1U, 100U}) {
        const answer a = succeeds([&] { return client().update(handle, pattern(size)); });
        EXPECT_EQ(a.b, size);
        EXPECT_EQ(a.size, 0U);
      }
      expect_same(before);
      (void)client().abort(handle);
    }
  }
}

TEST_F(UpdateTest, AnUnknownHandleIsFoundBeforeTheBodyIsRead) {
  const failure expected = refused(KM_ERROR_INVALID_OPERATION_HANDLE, {"Operation handle not found"});
  const std::uint32_t known = client().must_begin(KM_PURPOSE_SIGN, blob, raw);
  for (const std::uint32_t handle : {0U, 1U, known + 1, ~known, 0xFFFFFFFFU}) {
    for (const bytes& body : {bytes{}, bytes(3), join({prefixed(bytes{1}), prefixed(u32(0))})}) {
      const answer a = expect_failure(expected, [&] { return update_raw(handle, body); });
      EXPECT_EQ(a.b, 0U);
    }
  }
  EXPECT_TRUE(client().abort(known).ok());
}

TEST_F(UpdateTest, ABodyThatEndsInsideAFieldEndsTheOperation) {
  const failure expected = broken(TEEC_ERROR_GENERIC, {"Too short input"});
  for (const bytes& body : {bytes{}, bytes(3), u32(1), join({u32(0xFFFFFFFF), bytes(20)}), prefixed(pattern(10)),
                            join({prefixed(pattern(10)), bytes(3)}), join({prefixed(pattern(10)), u32(5), u32(0)}),
                            join({prefixed(pattern(10)), u32(0xFFFFFFFF), u32(0)})}) {
    SCOPED_TRACE(to_hex(body));
    expect_lost_by(expected, 0, body);
  }
}

TEST_F(UpdateTest, ParametersThatDontUnmarshalAreAnInvalidArgumentAndEndTheOperation) {
  expect_lost_by(refused(KM_ERROR_INVALID_ARGUMENT, {"Too short input", "Unmarshal failed"}), 10,
                 join({prefixed(pattern(10)), prefixed(bytes{})}));
  expect_lost_by(refused(KM_ERROR_INVALID_ARGUMENT, {"Too short input", "Unmarshal failed"}), 10,
                 join({prefixed(pattern(10)), prefixed(u32(1))}));
  expect_lost_by(refused(KM_ERROR_INVALID_ARGUMENT, {"Out of memory", "Unmarshal failed"}), 0,
                 join({prefixed(bytes{}), prefixed(u32(0x0AAAAAAB))}));
}

TEST_F(UpdateTest, BytesBehindTheParametersAreIgnored) {
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, raw);
  const bytes body = join({prefixed(pattern(10)), prefixed(u32(0)), pattern(30)});
  EXPECT_EQ(succeeds([&] { return update_raw(handle, body); }).b, 10U);
}

TEST_F(UpdateTest, AFailedUpdateCantBeRetried) {
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, raw);
  EXPECT_EQ(client().update(handle, pattern(129)).error, KM_ERROR_INVALID_INPUT_LENGTH);
  for (const std::uint32_t command : {KM_COMMAND_UPDATE, KM_COMMAND_FINISH}) {
    expect_failure(refused(KM_ERROR_INVALID_OPERATION_HANDLE, {"Operation handle not found"}), [&] {
      return client().call(command, handle, 0, join({prefixed(bytes{1}), prefixed(u32(0))}), std::size_t{512});
    });
  }
}

TEST_F(UpdateTest, AFailureOfOneOperationLeavesTheOthersAlone) {
  const std::uint32_t one = client().must_begin(KM_PURPOSE_SIGN, blob, with_digest);
  const std::uint32_t other = client().must_begin(KM_PURPOSE_SIGN, blob, with_digest);
  EXPECT_TRUE(client().update(one, from_text("kept")).ok());
  EXPECT_FALSE(update_raw(other, bytes(3)).ok());
  const finish_answer done = client().finish(one);
  EXPECT_TRUE(rsa_test_key::of_bits(1024).verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, from_text("kept"),
                                                   done.data));
}

TEST_F(UpdateTest, OperationsThatAreFedByTurnsDontMix) {
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  std::vector<std::uint32_t> handles;
  std::vector<bytes> messages(8);
  for (std::size_t i = 0; i < messages.size(); ++i) {
    handles.push_back(client().must_begin(KM_PURPOSE_SIGN, blob, i % 2 == 0 ? with_digest : raw));
  }
  for (std::uint32_t turn = 0; turn < 5; ++turn) {
    for (std::uint32_t i = 0; i < messages.size(); ++i) {
      const bytes piece = pattern(turn + i, i);
      EXPECT_TRUE(client().update(handles.at(i), piece).ok());
      messages.at(i) = join({messages.at(i), piece});
    }
  }
  for (std::size_t i = 0; i < messages.size(); ++i) {
    const finish_answer done = client().finish(handles.at(i));
    ASSERT_TRUE(done.ok());
    if (i % 2 == 0) {
      EXPECT_TRUE(key.verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, messages.at(i), done.data));
    } else {
      EXPECT_EQ(key.public_operation(done.data), join({bytes(128 - messages.at(i).size()), messages.at(i)}));
    }
  }
}

}  // namespace
}  // namespace testing_support
