// update, finish and abort with operations of the test's own: what the commands do themselves, whatever an algorithm
// does.
#include <algorithm>
#include <optional>

#include "auth/operation_pool.h"
#include "params/keymaster_protocol.h"
#include "ta/dispatch.h"
#include "tests/commands/raw_session.h"
#include "tests/support/ta_client.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace testing_support {
namespace {

/// An operation whose entries do as its members say and remember what they were given.
struct played_operation : keymaster_operation_t {
  TEE_Result result = TEE_SUCCESS;
  keymaster_error_t error = KM_ERROR_OK;
  std::optional<std::uint32_t> consumed;  // none: left as update got it
  bytes output;
  param_list out_params;

  bytes input_seen;
  param_list params_seen;
  std::uint32_t capacity_seen = 0, consumed_seen = 0;
  int freed = 0;
  bool freed_before_its_authorizations = false;
};

played_operation& played(keymaster_operation_t* op) {
  return *static_cast<played_operation*>(op);
}

void play_free(keymaster_operation_t* op) {
  ++played(op).freed;
  played(op).freed_before_its_authorizations = op->authorization_set.params != nullptr;
}

TEE_Result play_update(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                       std::span<const uint8_t> input, uint32_t* input_consumed, uint8_t* output,
                       uint32_t* output_length, keymaster_error_t* error) {
  played_operation& self = played(op);
  self.input_seen.assign(input.begin(), input.end());
  self.params_seen = from_ta(in_params);
  self.capacity_seen = *output_length;
  self.consumed_seen = *input_consumed;
  std::copy(self.output.begin(), self.output.end(), output);
  *output_length = static_cast<std::uint32_t>(self.output.size());
  if (self.consumed) *input_consumed = *self.consumed;
  *error = self.error;
  return self.result;
}

TEE_Result play_finish(keymaster_operation_t* op, const keymaster_key_param_set_t& in_params,
                       std::span<const uint8_t> input, secret_bytes& output, parameter_set& out_params,
                       keymaster_error_t* error) {
  played_operation& self = played(op);
  self.input_seen.assign(input.begin(), input.end());
  self.params_seen = from_ta(in_params);
  if (!output.copy_of(self.output)) return TEE_ERROR_OUT_OF_MEMORY;
  out_params = in_ta(self.out_params);
  *error = self.error;
  return self.result;
}

class GenericStepsTest : public TaUnitTest {
 protected:
  void SetUp() override { ASSERT_EQ(operation_pool_init(), TEE_SUCCESS); }

  /// file puts the operation into the pool, with a set of authorizations that it owns.
  void file() {
    operation.free = play_free;
    operation.update = play_update;
    operation.finish = play_finish;
    operation.authorization_set = in_ta(param_list{}.add_blob(KM_TAG_APPLICATION_ID, pattern(40))).release();
    keymaster_error_t error = KM_ERROR_OK;
    ASSERT_EQ(operation_pool_add(&operation, &handle, &error), TEE_SUCCESS);
    ASSERT_EQ(error, KM_ERROR_OK);
    ta.clear_trace();
  }

  raw_answer step(std::uint32_t command, std::size_t capacity = 64) {
    bytes request = join({prefixed(input), prefixed(in_params.marshal())});
    response = bytes(capacity, canary);
    TEE_Param params[4] = {values(handle, 0), memref(request), memref(response), {}};
    const TEE_Result result = TA_InvokeCommandEntryPoint(nullptr, command, with_both, params);
    return {result, static_cast<std::int32_t>(params[0].value.a), params[0].value.b, params[2].memref.size};
  }

  static void expect_answer(const raw_answer& got, const raw_answer& expected) {
    EXPECT_EQ(got.result, expected.result);
    EXPECT_EQ(got.error, expected.error);
    EXPECT_EQ(got.b, expected.b);
    EXPECT_EQ(got.size, expected.size);
  }

  void expect_gone() {
    EXPECT_EQ(operation.freed, 1);
    EXPECT_FALSE(operation.freed_before_its_authorizations);
    expect_same(ta.holdings(), {});
    EXPECT_EQ(operation_pool_get(handle), nullptr);
  }

  played_operation operation;
  std::uint32_t handle = 0;
  const bytes input = from_text("seven!!");
  const param_list in_params = param_list{}.add_blob(KM_TAG_ASSOCIATED_DATA, pattern(5)).add(KM_TAG_MAC_LENGTH, 96);
  bytes response;
};

TEST_F(GenericStepsTest, AnOperationWithoutUpdateEndsThere) {
  file();
  operation.update = nullptr;
  expect_answer(step(KM_COMMAND_UPDATE), {TEE_SUCCESS, KM_ERROR_UNIMPLEMENTED, 7, 0});
  EXPECT_THAT(ta.errors(), ElementsAre("Update not implemented"));
  expect_gone();
}

TEST_F(GenericStepsTest, AnOperationWithoutFinishEndsThere) {
  file();
  operation.finish = nullptr;
  expect_answer(step(KM_COMMAND_FINISH), {TEE_SUCCESS, KM_ERROR_UNIMPLEMENTED, 0, 0});
  EXPECT_THAT(ta.errors(), ElementsAre("Finish not implemented"));
  EXPECT_EQ(response, bytes(64, canary));
  expect_gone();
}

TEST_F(GenericStepsTest, UpdateHandsTheRequestOnAndAnswersWhatTheOperationDid) {
  file();
  operation.consumed = 3;
  operation.output = from_text("block");
  expect_answer(step(KM_COMMAND_UPDATE), {TEE_SUCCESS, KM_ERROR_OK, 3, 5});
  EXPECT_THAT(ta.errors(), IsEmpty());
  EXPECT_EQ(response, join({from_text("block"), bytes(59, canary)}));
  EXPECT_EQ(operation.input_seen, input);
  EXPECT_EQ(operation.params_seen.marshal(), in_params.marshal());
  EXPECT_EQ(operation.capacity_seen, 64U);
  EXPECT_EQ(operation.consumed_seen, input.size());

  EXPECT_EQ(operation.freed, 0);
  EXPECT_EQ(operation_pool_get(handle), &operation);
  TEE_Param params[4] = {values(handle, 0), {}, {}, {}};
  EXPECT_EQ(TA_InvokeCommandEntryPoint(nullptr, KM_COMMAND_ABORT, values_only, params), TEE_SUCCESS);
  EXPECT_EQ(params[0].value.a, 0U);
  expect_gone();
}

TEST_F(GenericStepsTest, UpdateThatLeavesTheCountAloneHasConsumedAll) {
  file();
  expect_answer(step(KM_COMMAND_UPDATE, 0), {TEE_SUCCESS, KM_ERROR_OK, 7, 0});
  EXPECT_EQ(operation.capacity_seen, 0U);
  operation_pool_remove(handle);
  keymaster_free_param_set(&operation.authorization_set);
}

TEST_F(GenericStepsTest, AFailedUpdateTellsWhatWasConsumedAndNoOutput) {
  operation.consumed = 0;
  operation.output = from_text("half");
  operation.error = KM_ERROR_INVALID_INPUT_LENGTH;
  file();
  expect_answer(step(KM_COMMAND_UPDATE), {TEE_SUCCESS, KM_ERROR_INVALID_INPUT_LENGTH, 0, 0});
  EXPECT_THAT(ta.errors(), ElementsAre("Update failed"));
  expect_gone();
}

TEST_F(GenericStepsTest, AFailureOfThePlatformIsPassedOnWithAnUnknownError) {
  operation.result = TEE_ERROR_SHORT_BUFFER;
  operation.output = from_text("half");
  for (const auto& [command, line, b] :
       {std::tuple{KM_COMMAND_UPDATE, "Update failed", 7U}, {KM_COMMAND_FINISH, "Finish failed", 0U}}) {
    file();
    expect_answer(step(command), {TEE_ERROR_SHORT_BUFFER, KM_ERROR_UNKNOWN_ERROR, b, 0});
    EXPECT_THAT(ta.errors(), ElementsAre(line));
    expect_gone();
    operation.freed = 0;
  }
}

TEST_F(GenericStepsTest, FinishAnswersOutputAndParametersWithoutTheHiddenOnes) {
  file();
  operation.output = from_text("signature");
  operation.out_params = param_list{}
                             .add_blob(KM_TAG_APPLICATION_ID, from_text("hidden"))
                             .add_blob(KM_TAG_NONCE, pattern(12))
                             .add_blob(KM_TAG_APPLICATION_DATA, from_text("hidden as well"));
  const bytes expected =
      join({prefixed(operation.output), prefixed(param_list{}.add_blob(KM_TAG_NONCE, pattern(12)).marshal())});
  expect_answer(step(KM_COMMAND_FINISH, 100),
                {TEE_SUCCESS, KM_ERROR_OK, 0, static_cast<std::uint32_t>(expected.size())});
  EXPECT_THAT(ta.errors(), IsEmpty());
  EXPECT_EQ(to_hex(response), to_hex(join({expected, bytes(100 - expected.size(), canary)})));
  EXPECT_EQ(operation.input_seen, input);
  EXPECT_EQ(operation.params_seen.marshal(), in_params.marshal());
  expect_gone();
}

TEST_F(GenericStepsTest, FinishWithoutOutputAnswersTwoLengths) {
  file();
  expect_answer(step(KM_COMMAND_FINISH, 12), {TEE_SUCCESS, KM_ERROR_OK, 0, 12});
  EXPECT_EQ(response, join({u32(0), u32(4), u32(0)}));
  expect_gone();
}

TEST_F(GenericStepsTest, AResponseWithoutRoomLosesTheOutputOfAnOperationThatIsGone) {
  operation.output = from_text("signature");
  operation.out_params = param_list{}.add_blob(KM_TAG_NONCE, pattern(12));
  constexpr std::size_t whole = 4 + 9 + 4 + 40;
  struct row {
    std::size_t capacity;
    TEE_Result result;
    std::vector<std::string> lines;
  };
  for (const row& each : {row{0, TEE_ERROR_GENERIC, {"Too short input"}},
                          {3, TEE_ERROR_GENERIC, {"Too short input"}},
                          {12, TEE_ERROR_GENERIC, {"Too short input"}},
                          {16, TEE_ERROR_GENERIC, {"Too short input"}},
                          {17, TEE_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"}},
                          {whole - 1, TEE_ERROR_SHORT_BUFFER, {"Too short marshalling buffer", "Marshal failed"}}}) {
    SCOPED_TRACE(each.capacity);
    file();
    expect_answer(step(KM_COMMAND_FINISH, each.capacity), {each.result, KM_ERROR_UNKNOWN_ERROR, 0, 0});
    EXPECT_EQ(ta.errors(), each.lines);
    expect_gone();
    operation.freed = 0;
  }
  file();
  expect_answer(step(KM_COMMAND_FINISH, whole), {TEE_SUCCESS, KM_ERROR_OK, 0, whole});
  expect_gone();
}

TEST_F(GenericStepsTest, OutputAndParametersOfAFailedFinishGoNowhere) {
  operation.output = from_text("signature");
  operation.out_params = param_list{}.add_blob(KM_TAG_NONCE, pattern(12));
  operation.error = KM_ERROR_VERIFICATION_FAILED;
  file();
  expect_answer(step(KM_COMMAND_FINISH), {TEE_SUCCESS, KM_ERROR_VERIFICATION_FAILED, 0, 0});
  EXPECT_THAT(ta.errors(), ElementsAre("Finish failed"));
  EXPECT_EQ(response, bytes(64, canary));
  expect_gone();
}

}  // namespace
}  // namespace testing_support
