// Signing with a key of the soter framework: the whole message is gathered, and somebody else makes a statement of it.
// The framework is the test's own here.
#include <fmt/format.h>

#include <optional>

#include "algorithms/rsa/rsa_sign.h"
#include "soter/soter_enhance.h"
#include "soter/soter_init.h"
#include "tests/support/rsa_test_key.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using hosted_tee::trace_level;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

/// How the framework behaves, and what it was asked.
struct played_soter {
  TEE_Result ready = TEE_SUCCESS;
  TEE_Result signs = TEE_SUCCESS;
  bytes statement = from_text("{\"signed\":1}");

  int asked = 0;
  bytes message;
  param_list in_params;
  TEE_OperationHandle operation = TEE_HANDLE_NULL, digest_operation = TEE_HANDLE_NULL;
  const keymaster_key_param_set_t* authorization_set = nullptr;
  std::size_t room = 0;
  std::optional<std::uint32_t> salt;  // of PSS
  int byte_behind = -1;
};
played_soter soter;

}  // namespace

// The program's own definitions go before those of the TA's library.
namespace keymaster {

TEE_Result soter_ensure_ready() {
  return soter.ready;
}
bool soter_ready() {
  return soter.ready == TEE_SUCCESS;
}
TEE_Result soter_init_resources() {
  return soter.ready;
}
void soter_release_resources() {}
void soter_start() {}

TEE_Result soter_enhance_sign_finish(const soter_signer& op, const keymaster_key_param_set_t& in_params,
                                     std::span<const uint8_t> message, secret_bytes& output) {
  ++soter.asked;
  soter.operation = op.operation;
  soter.digest_operation = op.digest_operation;
  soter.authorization_set = &op.authorization_set;
  soter.room = op.buffer.size();
  soter.salt.reset();
  if (op.salt != nullptr) soter.salt = op.salt->content.value.a;
  soter.byte_behind = message.data()[message.size()];
  soter.in_params = from_ta(in_params);
  soter.message.assign(message.begin(), message.end());
  if (!output.copy_of(soter.statement)) return TEE_ERROR_OUT_OF_MEMORY;
  return soter.signs;
}

}  // namespace keymaster

namespace {

class SoterPathTest : public TaUnitTest {
 protected:
  void SetUp() override { soter = played_soter(); }
  void TearDown() override {
    drop();
    TaUnitTest::TearDown();
  }

  struct created {
    keymaster_operation_t* op;
    TEE_Result result = TEE_SUCCESS;
    keymaster_error_t error = KM_ERROR_OK;
  };
  created create(const param_list& characteristics = rsa_key(512).add(KM_TAG_SOTER_KEY)) {
    const bytes key_data = join({u32(512), rsa_test_key::of_bits(512).material()});
    const parameter_set of_key = in_ta(characteristics), asked = in_ta(scheme);
    parameter_set out_params;
    ta.clear_trace();
    created made{nullptr};
    made.op = create_rsa_sign({key_data, of_key, asked, out_params}, &made.result, &made.error);
    EXPECT_EQ(out_params.params, nullptr);
    return made;
  }
  void start() {
    const created made = create();
    ASSERT_NE(made.op, nullptr);
    op = static_cast<rsa_sign_operation_t*>(made.op);
    ta.clear_trace();
    ta.faults().clear();
  }
  void drop() {
    if (op != nullptr) rsa_sign_free(op);
    op = nullptr;
  }

  keymaster_error_t update(std::span<const std::uint8_t> piece) {
    std::uint32_t consumed = static_cast<std::uint32_t>(piece.size()), output_length = 99;
    keymaster_error_t error = KM_ERROR_UNKNOWN_ERROR;
    EXPECT_EQ(rsa_sign_update(op, {}, piece, &consumed, nullptr, &output_length, &error), TEE_SUCCESS);
    EXPECT_EQ(output_length, 0U);
    EXPECT_EQ(consumed, piece.size());
    return error;
  }

  struct finished {
    TEE_Result result = TEE_SUCCESS;
    keymaster_error_t error = KM_ERROR_UNKNOWN_ERROR;
    bytes output;
  };
  finished finish(const param_list& params = {}) {
    const parameter_set in_params = in_ta(params);
    parameter_set out_params;
    secret_bytes output;
    finished done;
    done.result = rsa_sign_finish(op, in_params, from_text("not used"), output, out_params, &done.error);
    done.output.assign(output.span().begin(), output.span().end());
    return done;
  }

  param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  rsa_sign_operation_t* op = nullptr;
};

TEST_F(SoterPathTest, AKeyWithTheTagGetsABufferOf4096BytesBesideAllTheRest) {
  const created made = create();
  ASSERT_NE(made.op, nullptr);
  op = static_cast<rsa_sign_operation_t*>(made.op);
  EXPECT_EQ(made.result, TEE_SUCCESS);
  EXPECT_EQ(made.error, KM_ERROR_OK);
  EXPECT_EQ(op->soter_capacity, 4096U);
  EXPECT_EQ(op->soter_buffer.size(), 4097U);  // a zero byte behind the message
  EXPECT_EQ(op->soter_length, 0U);
  EXPECT_TRUE(op->key);
  EXPECT_TRUE(op->operation);
  EXPECT_TRUE(op->digest_operation);
  EXPECT_EQ(op->buffer.size(), 64U);
  EXPECT_THAT(ta.errors(), IsEmpty());
  EXPECT_THAT(ta.traced(trace_level::debug), ElementsAre("sign from soter, allocate raw message buffer"));
}

TEST_F(SoterPathTest, AKeyWithoutTheTagHasNothingToDoWithIt) {
  soter.ready = TEE_ERROR_GENERIC;
  const created made = create(rsa_key(512));
  ASSERT_NE(made.op, nullptr);
  op = static_cast<rsa_sign_operation_t*>(made.op);
  EXPECT_FALSE(op->soter_buffer);
  EXPECT_THAT(ta.traced(trace_level::debug), IsEmpty());
}

TEST_F(SoterPathTest, ResourcesThatCantBeLoadedEndTheSetUp) {
  for (const TEE_Result result : {TEE_ERROR_GENERIC, TEE_Result{0xF0100007}}) {
    soter.ready = result;
    const created made = create();
    EXPECT_EQ(made.op, nullptr);
    EXPECT_EQ(made.result, TEE_SUCCESS);
    EXPECT_EQ(made.error, KM_ERROR_UNKNOWN_ERROR);
    EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("soter resources is not ready, error 0x{:x}\n", result)));
    expect_same(ta.holdings(), {});
  }
}

TEST_F(SoterPathTest, WantOfMemoryForTheMessageHasItsOwnLine) {
  // The two sets of the request take two blocks, and the record one.
  ta.faults().fail_allocation(4);
  const created made = create();
  EXPECT_EQ(made.op, nullptr);
  EXPECT_EQ(made.result, TEE_SUCCESS);
  EXPECT_EQ(made.error, KM_ERROR_MEMORY_ALLOCATION_FAILED);
  EXPECT_THAT(ta.errors(), ElementsAre("No memory for soter"));
  expect_same(ta.holdings(), {});
}

TEST_F(SoterPathTest, TheMessageGrowsWithoutLimitByDoublingOrToWhatItNeeds) {
  start();
  const bytes message = pattern(4096 + 1 + 100'000);
  const std::span<const std::uint8_t> all(message);
  const std::string updating = "sign update is from soter";

  EXPECT_EQ(update(all.first(4096)), KM_ERROR_OK);
  EXPECT_EQ(op->soter_capacity, 4096U);
  EXPECT_THAT(ta.traced(trace_level::debug), ElementsAre(updating));

  ta.clear_trace();
  EXPECT_EQ(update(all.subspan(4096, 1)), KM_ERROR_OK);
  EXPECT_EQ(op->soter_capacity, 8192U);
  EXPECT_EQ(op->soter_buffer.size(), 8193U);
  EXPECT_THAT(ta.traced(trace_level::debug), ElementsAre(updating, "expand soter buf 4096 -> 8192"));

  ta.clear_trace();
  EXPECT_EQ(update(all.subspan(4097)), KM_ERROR_OK);
  EXPECT_EQ(op->soter_capacity, message.size());
  EXPECT_EQ(op->soter_buffer.size(), message.size() + 1);
  EXPECT_THAT(ta.traced(trace_level::debug), ElementsAre(updating, "expand soter buf 8192 -> 104097"));

  EXPECT_EQ(update({}), KM_ERROR_OK);
  EXPECT_EQ(op->soter_capacity, message.size());
  EXPECT_THAT(ta.errors(), IsEmpty());
  EXPECT_EQ(finish().error, KM_ERROR_OK);
  EXPECT_EQ(soter.message, message);
  EXPECT_EQ(soter.byte_behind, 0) << "a full buffer can be read as text";
}

TEST_F(SoterPathTest, WhatTheMessageGrewOutOfIsWiped) {
  start();
  const bytes message = pattern(9000);
  std::size_t freed = 0;
  bool left = false;
  ta.on_free([&](std::span<const std::uint8_t> block) {
    ++freed;
    for (std::size_t at = 0; at + 16 <= message.size(); at += 500) {
      left = left || contains(block, std::span(message).subspan(at, 16));
    }
  });
  EXPECT_EQ(update(std::span(message).first(4000)), KM_ERROR_OK);
  EXPECT_EQ(update(std::span(message).subspan(4000)), KM_ERROR_OK);
  EXPECT_EQ(freed, 1U);
  drop();
  EXPECT_GT(freed, 2U);
  EXPECT_FALSE(left);
}

TEST_F(SoterPathTest, WithoutMemoryToGrowTheMessageStaysAsItWas) {
  start();
  const bytes message = pattern(4096);
  ASSERT_EQ(update(message), KM_ERROR_OK);
  const auto before = ta.holdings();
  ta.clear_trace();
  ta.faults().fail_allocation(1);
  EXPECT_EQ(update(bytes(1)), KM_ERROR_MEMORY_ALLOCATION_FAILED);
  EXPECT_THAT(ta.errors(), ElementsAre("no memory to expand soter buf 8192"));
  EXPECT_THAT(ta.traced(trace_level::debug), ElementsAre("sign update is from soter"));
  ta.clear_trace();
  EXPECT_EQ(update(bytes(600'000)), KM_ERROR_MEMORY_ALLOCATION_FAILED);  // more than the heap
  EXPECT_THAT(ta.errors(), ElementsAre("no memory to expand soter buf 604096"));
  expect_same(ta.holdings(), before);
  EXPECT_EQ(op->soter_capacity, 4096U);
  EXPECT_EQ(finish().error, KM_ERROR_OK);
  EXPECT_EQ(soter.message, message);
}

TEST_F(SoterPathTest, ALengthBeyond32BitsIsWantOfMemory) {
  start();
  op->soter_length = op->soter_capacity = 0xFFFFFFF0;
  EXPECT_EQ(update(bytes(32)), KM_ERROR_MEMORY_ALLOCATION_FAILED);
  EXPECT_THAT(ta.errors(), ElementsAre("no memory to expand soter buf 4294967295"));
  EXPECT_EQ(op->soter_length, 0xFFFFFFF0U);
}

TEST_F(SoterPathTest, TheStatementIsTheOutput) {
  start();
  ASSERT_EQ(update(from_text("message")), KM_ERROR_OK);
  ta.clear_trace();
  const param_list params = param_list{}.add_blob(KM_TAG_NONCE, pattern(9)).add(KM_TAG_MAC_LENGTH, 5);
  const finished done = finish(params);
  EXPECT_EQ(done.result, TEE_SUCCESS);
  EXPECT_EQ(done.error, KM_ERROR_OK);
  EXPECT_EQ(done.output, soter.statement);
  EXPECT_THAT(ta.errors(), IsEmpty());
  EXPECT_THAT(ta.traced(trace_level::debug), ElementsAre("sign finish is from soter"));
  EXPECT_EQ(soter.asked, 1);
  EXPECT_EQ(soter.message, from_text("message"));
  EXPECT_EQ(soter.in_params.marshal(), params.marshal());
  EXPECT_EQ(soter.operation, op->operation.get());
  EXPECT_EQ(soter.digest_operation, op->digest_operation.get());
  EXPECT_EQ(soter.authorization_set, &op->authorization_set);
  EXPECT_EQ(soter.room, 64U);
  EXPECT_EQ(soter.salt, std::nullopt);
}

TEST_F(SoterPathTest, TheSaltOfPssIsAsLongAsTheDigestWhereBothFit) {
  // 64 bytes: SHA-224 leaves room for a salt of its length (2 * 29), SHA-256 does not (2 * 33).
  for (const auto& [digest, salt] : {std::pair{KM_DIGEST_SHA_2_224, -1}, std::pair{KM_DIGEST_SHA_2_256, -2}}) {
    scheme = signature(digest, KM_PAD_RSA_PSS);
    start();
    EXPECT_EQ(finish().error, KM_ERROR_OK);
    EXPECT_EQ(soter.salt, static_cast<std::uint32_t>(salt));
    drop();
  }
}

TEST_F(SoterPathTest, AKeyThatSignsWithoutADigestHasNoDigestOperation) {
  scheme = signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN);
  start();
  EXPECT_EQ(finish().error, KM_ERROR_OK);
  EXPECT_EQ(soter.digest_operation, TEE_OperationHandle{TEE_HANDLE_NULL});
}

TEST_F(SoterPathTest, AnEmptyMessageIsOneToo) {
  start();
  EXPECT_EQ(finish().error, KM_ERROR_OK);
  EXPECT_EQ(soter.asked, 1);
  EXPECT_THAT(soter.message, IsEmpty());
}

TEST_F(SoterPathTest, AStatementThatFailsIsAnUnknownErrorAndNoOutput) {
  start();
  ASSERT_EQ(update(from_text("message")), KM_ERROR_OK);
  soter.signs = TEE_ERROR_ACCESS_DENIED;
  const finished done = finish();
  EXPECT_EQ(done.result, TEE_SUCCESS);
  EXPECT_EQ(done.error, KM_ERROR_UNKNOWN_ERROR);
  EXPECT_THAT(done.output, IsEmpty());
  EXPECT_THAT(ta.errors(), ElementsAre("soter enhance error ffff0001"));
}

}  // namespace
