// HMAC functions with arguments that no command hands over.
#include "algorithms/hmac/hmac_key.h"
#include "algorithms/hmac/hmac_operation.h"
#include "tests/support/hmac_test_key.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;

namespace testing_support {
namespace {

using lines = std::vector<std::string>;

struct record_entries {
  keymaster_operation_t* (*create)(const operation_request&, TEE_Result*, keymaster_error_t*);
  void (*free)(keymaster_operation_t*);
  const char* name;
};
constexpr record_entries both[] = {{create_hmac_sign, hmac_sign_free, "hmac_sign_operation_t"},
                                   {create_hmac_verify, hmac_verify_free, "hmac_verify_operation_t"}};

class HmacFunctionsTest : public TaUnitTest {
 protected:
  const bytes key_data = join({u32(256), u32(TEE_TYPE_HMAC_SHA256), pattern(32)});

  hmac_operation_t* create(const record_entries& entries, std::uint32_t bits) {
    const parameter_set in_params = in_ta(hmac_length(bits)), none;
    parameter_set out_params;
    TEE_Result result = TEE_SUCCESS;
    keymaster_error_t error = KM_ERROR_OK;
    return static_cast<hmac_operation_t*>(entries.create({key_data, none, in_params, out_params}, &result, &error));
  }
};

TEST_F(HmacFunctionsTest, FreeingNothingIsTraced) {
  for (const record_entries& entries : both) {
    ta.clear_trace();
    entries.free(nullptr);
    EXPECT_EQ(ta.errors(), (lines{std::string("Try to free NULL ") + entries.name}));
  }
}

TEST_F(HmacFunctionsTest, FreeingARecordTracesEachHandleThatIsMissing) {
  for (const record_entries& entries : both) {
    const std::string line = std::string("Try to free invalid ") + entries.name;
    for (const bool lose_key : {false, true}) {
      for (const bool lose_operation : {false, true}) {
        hmac_operation_t* const op = create(entries, 256);
        ASSERT_NE(op, nullptr);
        if (lose_operation) op->operation.reset();
        if (lose_key) op->key.reset();
        ta.clear_trace();
        entries.free(op);
        EXPECT_EQ(ta.errors(), lines(std::size_t{lose_key} + std::size_t{lose_operation}, line));
      }
    }
  }
}

TEST_F(HmacFunctionsTest, TheConstructorSetsNoBoundsOnTheLength) {
  for (const record_entries& entries : both) {
    for (const std::uint32_t bits : {0U, 1U, 7U, 8U, 4096U, 0xFFFFFFFFU}) {
      hmac_operation_t* const op = create(entries, bits);
      ASSERT_NE(op, nullptr);
      EXPECT_EQ(op->mac_length, bits);
      EXPECT_EQ(op->key_size, 256U);
      EXPECT_EQ(op->free, entries.free);
      op->free(op);
    }
  }
}

TEST_F(HmacFunctionsTest, AMacWithoutBytesIsMadeAndHoldsWhateverIsGiven) {
  const parameter_set none;
  for (const std::uint32_t bits : {0U, 7U}) {
    keymaster_error_t error = KM_ERROR_UNKNOWN_ERROR;
    secret_bytes output;
    parameter_set out_params;
    hmac_operation_t* op = create(both[0], bits);
    EXPECT_EQ(op->finish(op, none, {}, output, out_params, &error), TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_OK);
    EXPECT_EQ(output.size(), 0U);
    op->free(op);
    for (const bytes& given : {bytes{}, bytes{1, 2}}) {
      op = create(both[1], bits);
      EXPECT_EQ(op->finish(op, none, given, output, out_params, &error), TEE_SUCCESS);
      EXPECT_EQ(error, KM_ERROR_OK);
      op->free(op);
    }
  }
  EXPECT_TRUE(ta.errors().empty());
}

TEST_F(HmacFunctionsTest, AnEmptyUpdateIsAllowed) {
  const parameter_set none;
  hmac_operation_t* const op = create(both[0], 256);
  keymaster_error_t error = KM_ERROR_UNKNOWN_ERROR;
  std::uint32_t consumed = 0, length = 77;
  EXPECT_EQ(op->update(op, none, {}, &consumed, nullptr, &length, &error), TEE_SUCCESS);
  EXPECT_EQ(error, KM_ERROR_OK);
  EXPECT_EQ(length, 0U);
  secret_bytes output;
  parameter_set out_params;
  EXPECT_EQ(op->finish(op, none, {}, output, out_params, &error), TEE_SUCCESS);
  EXPECT_EQ(bytes(output.data(), output.data() + output.size()), hmac_sha256(pattern(32), {}));
  op->free(op);
}

TEST_F(HmacFunctionsTest, KeyDataResolvesToAnObjectItsTypeAndItsSize) {
  for (const hmac_limits& each : every_hmac) {
    const bytes data = join({u32(each.longest_key), u32(each.object_type), pattern(each.longest_key / 8)});
    for (const bool wants_size : {false, true}) {
      TEE_ObjectHandle key = TEE_HANDLE_NULL;
      std::uint32_t type = 0, size = 0;
      keymaster_error_t error = KM_ERROR_UNKNOWN_ERROR;
      EXPECT_EQ(hmac_resolve_key_data(data, &key, &type, wants_size ? &size : nullptr, &error), TEE_SUCCESS);
      EXPECT_EQ(error, KM_ERROR_OK);
      EXPECT_EQ(type, each.object_type);
      EXPECT_EQ(size, wants_size ? each.longest_key : 0);
      TEE_FreeTransientObject(key);
    }
  }
}

TEST_F(HmacFunctionsTest, KeyDataThatEndsTooSoonResolvesToNothing) {
  for (std::size_t size = 0; size < key_data.size(); ++size) {
    TEE_ObjectHandle key = TEE_HANDLE_NULL;
    std::uint32_t type = 0, bits = 0;
    keymaster_error_t error = KM_ERROR_OK;
    ta.clear_trace();
    EXPECT_EQ(hmac_resolve_key_data(std::span(key_data).first(size), &key, &type, &bits, &error), TEE_ERROR_GENERIC);
    EXPECT_EQ(key, TEE_ObjectHandle{TEE_HANDLE_NULL});
    EXPECT_EQ(error, KM_ERROR_OK);
    EXPECT_EQ(ta.errors(), (lines{"Too short input"}));
  }
}

}  // namespace
}  // namespace testing_support
