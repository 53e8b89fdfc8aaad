// Keys that are shorter than the padding alone. No platform here makes or takes one, but another may.
#include "algorithms/rsa/rsa_sign.h"
#include "algorithms/rsa/rsa_signature_scheme.h"
#include "algorithms/rsa/rsa_verify.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

class ShortKeyTest : public TaUnitTest {
 protected:
  /// A record of the raw path with PKCS#1 v1.5 padding, whose buffer holds `fill`.
  template <class Record>
  static Record of_bits(std::uint32_t bits, const bytes& fill) {
    Record op;
    op.key_size = bits;
    op.padding = KM_PAD_RSA_PKCS1_1_5_SIGN;
    op.digest = KM_DIGEST_NONE;
    EXPECT_TRUE(op.buffer.copy_of(fill));
    return op;
  }

  /// expect_refused updates with `input` and expects the line, nothing consumed and nothing changed.
  void expect_refused(operation_update update, rsa_operation_t& op, const bytes& input, const char* line) {
    const bytes before(op.buffer.span().begin(), op.buffer.span().end());
    std::uint32_t consumed = static_cast<std::uint32_t>(input.size()), output_length = 77;
    keymaster_error_t error = KM_ERROR_OK;
    ta.clear_trace();
    EXPECT_EQ(update(&op, {}, input, &consumed, nullptr, &output_length, &error), TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_INVALID_INPUT_LENGTH);
    EXPECT_EQ(consumed, 0U);
    EXPECT_EQ(output_length, 0U);
    EXPECT_EQ(op.buffered, 0U);
    EXPECT_THAT(ta.errors(), ElementsAre(line));
    EXPECT_EQ(bytes(op.buffer.span().begin(), op.buffer.span().end()), before);
  }

  /// expect_no_block finishes and expects that no block is built and no platform operation asked.
  void expect_no_block(operation_finish finish, rsa_operation_t& op) {
    const bytes before(op.buffer.span().begin(), op.buffer.span().end());
    secret_bytes output;
    parameter_set out_params;
    keymaster_error_t error = KM_ERROR_OK;
    ta.clear_trace();
    EXPECT_EQ(finish(&op, {}, bytes(10), output, out_params, &error), TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_INVALID_INPUT_LENGTH);
    EXPECT_FALSE(output);
    EXPECT_THAT(ta.errors(), IsEmpty());
    EXPECT_EQ(bytes(op.buffer.span().begin(), op.buffer.span().end()), before);
    EXPECT_EQ(ta.faults().fallible_calls(), 0U);
  }
};

TEST_F(ShortKeyTest, TenBytesHoldNoMessageNotEvenAnEmptyOne) {
  auto sign = of_bits<rsa_sign_operation_t>(80, pattern(10));
  EXPECT_EQ(raw_message_limit(sign), -1);
  expect_refused(rsa_sign_update, sign, {}, "Input too long to sign, key_size 80, input 0B");
  expect_refused(rsa_sign_update, sign, {1}, "Input too long to sign, key_size 80, input 1B");
  expect_no_block(rsa_sign_finish, sign);
  EXPECT_FALSE(build_pkcs1_block(sign));

  auto verify = of_bits<rsa_verify_operation_t>(80, pattern(10));
  expect_refused(rsa_verify_update, verify, {}, "Input too long to verify, key_size 80, input 0B");
  expect_refused(rsa_verify_update, verify, bytes(11), "Input too long to verify, key_size 80, input 11B");
  expect_no_block(rsa_verify_finish, verify);
}

TEST_F(ShortKeyTest, NoBytesAtAllHoldNothing) {
  auto sign = of_bits<rsa_sign_operation_t>(0, {});
  EXPECT_EQ(raw_message_limit(sign), -11);
  expect_refused(rsa_sign_update, sign, {}, "Input too long to sign, key_size 0, input 0B");
  expect_no_block(rsa_sign_finish, sign);
  auto verify = of_bits<rsa_verify_operation_t>(0, {});
  expect_refused(rsa_verify_update, verify, {}, "Input too long to verify, key_size 0, input 0B");
  expect_no_block(rsa_verify_finish, verify);
}

TEST_F(ShortKeyTest, ElevenBytesHoldTheEmptyMessage) {
  auto op = of_bits<rsa_sign_operation_t>(88, bytes(11));
  EXPECT_EQ(raw_message_limit(op), 0);
  std::uint32_t consumed = 0, output_length = 77;
  keymaster_error_t error = KM_ERROR_UNKNOWN_ERROR;
  EXPECT_EQ(rsa_sign_update(&op, {}, {}, &consumed, nullptr, &output_length, &error), TEE_SUCCESS);
  EXPECT_EQ(error, KM_ERROR_OK);
  expect_refused(rsa_sign_update, op, {1}, "Input too long to sign, key_size 88, input 1B");
  EXPECT_TRUE(build_pkcs1_block(op));
  EXPECT_EQ(bytes(op.buffer.span().begin(), op.buffer.span().end()),
            (bytes{0, 1, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0}));
}

}  // namespace
