// The constructors and entries of AES operations themselves: what they say where a client would hear the policy first,
// what they hold when memory runs out, and what no client can bring about.
#include <fmt/format.h>

#include "algorithms/aes/aes_decrypt.h"
#include "algorithms/aes/aes_encrypt.h"
#include "tests/support/encryption.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using testing::ElementsAre;
using testing::IsEmpty;

namespace testing_support {
namespace {

struct direction {
  const char* name;
  keymaster_operation_t* (*create)(const operation_request&, TEE_Result*, keymaster_error_t*);
};
constexpr direction directions[] = {{"encrypt", create_aes_encrypt}, {"decrypt", create_aes_decrypt}};

class AesConstructorTest : public TaUnitTest {
 protected:
  const bytes key = pattern(16, 5);
  const bytes key_data = join({u32(128), key});
  const bytes iv = pattern(16);

  TEE_Result result = TEE_SUCCESS;
  keymaster_error_t error = KM_ERROR_OK;
  parameter_set told;

  keymaster_operation_t* create(const direction& way, const param_list& list) {
    const parameter_set params = in_ta(list), none;
    result = TEE_SUCCESS;
    error = KM_ERROR_OK;
    told.reset();
    ta.clear_trace();
    return way.create({key_data, none, params, told}, &result, &error);
  }
  void expect_refused(keymaster_error_t expected, const param_list& list) {
    for (const direction& way : directions) {
      SCOPED_TRACE(way.name);
      EXPECT_EQ(create(way, list), nullptr);
      EXPECT_EQ(result, TEE_SUCCESS);
      EXPECT_EQ(error, expected);
      EXPECT_THAT(ta.errors(), IsEmpty());
      EXPECT_EQ(told.length, 0U);
      expect_same(ta.holdings(), {});
    }
  }

  struct step {
    TEE_Result result = 0;
    keymaster_error_t error = KM_ERROR_OK;
    bytes output;
  };
  static step update(keymaster_operation_t* op, const bytes& input, std::size_t capacity = 256) {
    step done;
    done.output.resize(capacity);
    auto consumed = static_cast<std::uint32_t>(input.size()), length = static_cast<std::uint32_t>(capacity);
    const parameter_set none;
    done.result = op->update(op, none, input, &consumed, done.output.data(), &length, &done.error);
    EXPECT_EQ(consumed, input.size());
    done.output.resize(length);
    return done;
  }
  static step finish(keymaster_operation_t* op) {
    step done;
    const parameter_set none;
    parameter_set out;
    secret_bytes output;
    done.result = op->finish(op, none, {}, output, out, &done.error);
    done.output.assign(output.span().begin(), output.span().end());
    return done;
  }
};

TEST_F(AesConstructorTest, EcbTakesNoNonce) {
  expect_refused(KM_ERROR_INVALID_TAG, cipher(KM_MODE_ECB, KM_PAD_NONE, iv));
  expect_refused(KM_ERROR_INVALID_TAG, cipher(KM_MODE_ECB, KM_PAD_PKCS7, pattern(1)));
}

TEST_F(AesConstructorTest, APaddingThatTheModeHasNotIsIncompatible) {
  for (const std::uint32_t padding : {0U, 2U, 3U, 4U, 5U, 65U}) {
    for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR}) {
      expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, cipher(mode, padding));
    }
  }
  expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, cipher(KM_MODE_CTR, KM_PAD_PKCS7));
  expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, cipher(KM_MODE_GCM, KM_PAD_PKCS7).add(KM_TAG_MAC_LENGTH, 128));
}

TEST_F(AesConstructorTest, AnUnknownModeIsUnsupportedWhateverThePadding) {
  for (const std::uint32_t mode : {0U, 4U, 31U, 33U, 0xFFFFFFFFU}) {
    expect_refused(KM_ERROR_UNSUPPORTED_BLOCK_MODE, cipher(mode, KM_PAD_NONE));
    expect_refused(KM_ERROR_UNSUPPORTED_BLOCK_MODE, cipher(mode, 99));
  }
}

TEST_F(AesConstructorTest, WhetherTheClientMayChooseItsNonceIsNotAskedHere) {
  for (const direction& way : directions) {
    keymaster_operation_t* const op = create(way, cipher(KM_MODE_CBC, KM_PAD_NONE, iv));
    ASSERT_NE(op, nullptr);
    EXPECT_EQ(from_ta(told).blob(KM_TAG_NONCE), iv);
    op->free(op);
    told.reset();
  }
}

TEST_F(AesConstructorTest, EveryAllocationThatFailsIsWantOfMemoryAndLeavesNothingBehind) {
  const param_list requests[] = {cipher(KM_MODE_ECB), cipher(KM_MODE_CBC, KM_PAD_PKCS7), cipher(KM_MODE_CTR),
                                 cipher(KM_MODE_GCM).add(KM_TAG_MAC_LENGTH, 128)};
  for (const direction& way : directions) {
    for (const param_list& request : requests) {
      SCOPED_TRACE(fmt::format("{} in mode {}", way.name, request.value(KM_TAG_BLOCK_MODE)));
      const parameter_set params = in_ta(request), none;
      const hosted_tee::accounting before = ta.holdings();
      unsigned failures = 0;
      for (std::uint32_t n = 1;; ++n) {
        SCOPED_TRACE(fmt::format("allocation {}", n));
        result = TEE_SUCCESS;
        error = KM_ERROR_OK;
        ta.clear_trace();
        ta.faults().clear();
        ta.faults().fail_allocation(n);
        keymaster_operation_t* const op = way.create({key_data, none, params, told}, &result, &error);
        const bool failed = ta.faults().triggered();
        ta.faults().clear();
        if (!failed) {
          ASSERT_NE(op, nullptr);
          op->free(op);
          told.reset();
          break;
        }
        ++failures;
        EXPECT_EQ(op, nullptr);
        EXPECT_EQ(result, TEE_SUCCESS);
        // The record alone has no code of its own.
        EXPECT_EQ(error, n == 1 ? KM_ERROR_OK : KM_ERROR_MEMORY_ALLOCATION_FAILED);
        EXPECT_THAT(ta.errors(), ElementsAre("Out of memory"));
        EXPECT_EQ(told.length, 0U);
        expect_same(ta.holdings(), before);
      }
      const bool holds_buffer = way.create == create_aes_decrypt &&
                                (request.has(KM_TAG_MAC_LENGTH) || request.value(KM_TAG_PADDING) == KM_PAD_PKCS7);
      // The record; the nonce and the place in the set that tells it; a tag buffer or a last block.
      EXPECT_EQ(failures, (request.value(KM_TAG_BLOCK_MODE) == KM_MODE_ECB ? 1U : 3U) + (holds_buffer ? 1U : 0U));
    }
  }
}

TEST_F(AesConstructorTest, WantOfMemoryAtTheEndLosesTheOutput) {
  struct row {
    const direction& way;
    param_list request;
    bytes input;
  };
  const bytes padded_block = aes_encrypt({KM_MODE_CBC, KM_PAD_PKCS7, key, iv}, pattern(5));
  for (const row& each : {row{directions[0], cipher(KM_MODE_CBC, KM_PAD_PKCS7, iv), pattern(5)},
                          {directions[0], cipher(KM_MODE_CTR, KM_PAD_NONE, iv), pattern(5)},
                          {directions[1], cipher(KM_MODE_CBC, KM_PAD_PKCS7, iv), padded_block}}) {
    keymaster_operation_t* const op = create(each.way, each.request);
    ASSERT_NE(op, nullptr);
    EXPECT_EQ(update(op, each.input).error, KM_ERROR_OK);
    ta.faults().fail_allocation(1);
    const step last = finish(op);
    ta.faults().clear();
    EXPECT_EQ(last.result, TEE_SUCCESS);
    EXPECT_EQ(last.error, KM_ERROR_MEMORY_ALLOCATION_FAILED);
    EXPECT_TRUE(last.output.empty());
    EXPECT_THAT(ta.errors(), ElementsAre("Out of memory"));
    op->free(op);
    told.reset();
  }
}

TEST_F(AesConstructorTest, AStreamAsLongAsTheCountersOf32BitsKeepsItsLastBlock) {
  const bytes text = pattern(32), whole = aes_encrypt({KM_MODE_ECB, KM_PAD_PKCS7, key, {}}, text);
  keymaster_operation_t* const op = create(directions[1], cipher(KM_MODE_ECB, KM_PAD_PKCS7));
  ASSERT_NE(op, nullptr);
  // As if as many bytes had gone before that the next update ends at 2^32 exactly.
  auto& record = static_cast<aes_decrypt_operation_t&>(*op);
  record.processed = (std::uint64_t{1} << 32) - 16;
  const step first_update = update(op, {whole.begin(), whole.begin() + 16});
  EXPECT_EQ(first_update.output, bytes(16));  // the block that was held from before
  const step second_update = update(op, {whole.begin() + 16, whole.end()});
  EXPECT_EQ(second_update.output, text);
  EXPECT_EQ(record.processed, (std::uint64_t{1} << 32) + 32);
  const step last = finish(op);
  EXPECT_EQ(last.error, KM_ERROR_OK);
  EXPECT_TRUE(last.output.empty());
  op->free(op);
}

TEST_F(AesConstructorTest, PaddingOf32BitsOfInputIsCountedRight) {
  keymaster_operation_t* const op = create(directions[0], cipher(KM_MODE_ECB, KM_PAD_PKCS7));
  ASSERT_NE(op, nullptr);
  auto& record = static_cast<aes_encrypt_operation_t&>(*op);
  record.processed = (std::uint64_t{1} << 32) - 16;
  EXPECT_EQ(update(op, pattern(16)).output.size(), 16U);
  EXPECT_EQ(finish(op).output, aes_encrypt({KM_MODE_ECB, KM_PAD_PKCS7, key, {}}, {}));
  op->free(op);
}

TEST_F(AesConstructorTest, AFailedUpdateLeavesTheRecordToBeFreed) {
  for (const direction& way : directions) {
    keymaster_operation_t* const op = create(way, cipher(KM_MODE_CTR, KM_PAD_NONE, iv));
    ASSERT_NE(op, nullptr);
    const step failed = update(op, pattern(20), 19);
    EXPECT_EQ(failed.result, TEE_ERROR_SHORT_BUFFER);
    EXPECT_THAT(ta.errors(), ElementsAre("CipherUpdate failed with 0xffff0010\n"));
    ta.clear_trace();
    op->free(op);
    EXPECT_THAT(ta.errors(), IsEmpty());
    told.reset();
  }
}

TEST_F(AesConstructorTest, FreeingNothingIsTracedUnderTheSameNameInBothDirections) {
  for (const operation_free free : {aes_encrypt_free, aes_decrypt_free}) {
    ta.clear_trace();
    free(nullptr);
    EXPECT_THAT(ta.errors(), ElementsAre("Try to free NULL aes_encrypt_operation_t"));
  }
}

TEST_F(AesConstructorTest, FreeingARecordTracesEachOfItsHandlesThatIsMissingAndFreesTheRest) {
  constexpr const char* line = "Try to free invalid aes_encrypt_operation_t";
  aes_encrypt_free(new_record<aes_encrypt_operation_t>());
  EXPECT_THAT(ta.errors(), ElementsAre(line, line));
  ta.clear_trace();
  auto* const decrypt = new_record<aes_decrypt_operation_t>();
  ASSERT_TRUE(decrypt->tag_buffer.allocate(16) && decrypt->last_block.allocate(16));
  ASSERT_EQ(decrypt->key.allocate(TEE_TYPE_AES, 128), TEE_SUCCESS);
  aes_decrypt_free(decrypt);
  EXPECT_THAT(ta.errors(), ElementsAre(line));
  ta.clear_trace();
  auto* const encrypt = new_record<aes_encrypt_operation_t>();
  ASSERT_EQ(encrypt->operation.allocate(TEE_ALG_AES_CTR, TEE_MODE_ENCRYPT, 128), TEE_SUCCESS);
  aes_encrypt_free(encrypt);
  EXPECT_THAT(ta.errors(), ElementsAre(line));
}

}  // namespace
}  // namespace testing_support
