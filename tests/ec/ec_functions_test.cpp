// EC functions with arguments that no command hands over.
#include "algorithms/ec/ec_key.h"
#include "algorithms/ec/ec_key_data.h"
#include "algorithms/ec/ec_operation.h"
#include "tests/support/ec_test_key.h"
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
constexpr record_entries both[] = {{create_ec_sign, ec_sign_free, "ec_sign_operation_t"},
                                   {create_ec_verify, ec_verify_free, "ec_verify_operation_t"}};

class EcFunctionsTest : public TaUnitTest {
 protected:
  const bytes key_data = ec_test_key::of_bits(256).material();

  ec_operation_t* create(const record_entries& entries, const param_list& params) {
    const parameter_set in_params = in_ta(params), none;
    parameter_set out_params;
    TEE_Result result = TEE_SUCCESS;
    keymaster_error_t error = KM_ERROR_OK;
    return static_cast<ec_operation_t*>(entries.create({key_data, none, in_params, out_params}, &result, &error));
  }
};

TEST_F(EcFunctionsTest, FreeingNothingIsTraced) {
  for (const record_entries& entries : both) {
    ta.clear_trace();
    entries.free(nullptr);
    EXPECT_EQ(ta.errors(), (lines{std::string("Try to free NULL ") + entries.name}));
  }
}

TEST_F(EcFunctionsTest, FreeingARecordTracesEachHandleThatIsMissing) {
  for (const record_entries& entries : both) {
    const std::string line = std::string("Try to free invalid ") + entries.name;
    for (const bool lose_key : {false, true}) {
      for (const bool lose_operation : {false, true}) {
        ec_operation_t* const op = create(entries, ec_digest(KM_DIGEST_SHA_2_256));
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

TEST_F(EcFunctionsTest, ARecordWithoutADigestIsFreedSilently) {
  for (const record_entries& entries : both) {
    ec_operation_t* const op = create(entries, ec_digest(KM_DIGEST_NONE));
    ASSERT_NE(op, nullptr);
    EXPECT_FALSE(op->uses_digest);
    EXPECT_FALSE(op->digest_operation);
    ta.clear_trace();
    entries.free(op);
    EXPECT_TRUE(ta.errors().empty());
  }
}

TEST_F(EcFunctionsTest, TheRecordBeginsWithTheGenericOne) {
  for (const record_entries& entries : both) {
    ec_operation_t* const op = create(entries, ec_digest(KM_DIGEST_SHA1));
    ASSERT_NE(op, nullptr);
    EXPECT_EQ(static_cast<void*>(op), static_cast<void*>(static_cast<keymaster_operation_t*>(op)));
    EXPECT_EQ(op->key_size, 256U);
    EXPECT_TRUE(op->uses_digest);
    EXPECT_EQ(op->free, entries.free);
    op->free(op);
  }
}

TEST_F(EcFunctionsTest, KeyDataResolvesWhoeverWantsItsSize) {
  for (const std::uint32_t bits : ec_sizes) {
    for (const bool wants_size : {false, true}) {
      TEE_ObjectHandle key = TEE_HANDLE_NULL;
      std::uint32_t size = 0;
      keymaster_error_t error = KM_ERROR_UNKNOWN_ERROR;
      EXPECT_EQ(ec_resolve_key_data(ec_test_key::of_bits(bits).material(), &key, wants_size ? &size : nullptr, &error),
                TEE_SUCCESS);
      EXPECT_EQ(error, KM_ERROR_OK);
      EXPECT_EQ(size, wants_size ? bits : 0);
      TEE_ObjectInfo info = {};
      ASSERT_EQ(TEE_GetObjectInfo1(key, &info), TEE_SUCCESS);
      EXPECT_EQ(info.objectType, TEE_TYPE_ECDSA_KEYPAIR);
      EXPECT_EQ(info.keySize, bits);
      TEE_FreeTransientObject(key);
    }
  }
}

TEST_F(EcFunctionsTest, KeyDataThatEndsTooSoonResolvesToNothing) {
  for (std::size_t size = 0; size < key_data.size(); ++size) {
    TEE_ObjectHandle key = TEE_HANDLE_NULL;
    keymaster_error_t error = KM_ERROR_OK;
    ta.clear_trace();
    EXPECT_EQ(ec_resolve_key_data(std::span(key_data).first(size), &key, nullptr, &error), TEE_ERROR_GENERIC);
    EXPECT_EQ(key, TEE_ObjectHandle{TEE_HANDLE_NULL});
    EXPECT_EQ(error, KM_ERROR_OK);
    EXPECT_EQ(ta.errors(), (lines{"Too short input"}));
  }
}

TEST_F(EcFunctionsTest, KeyDataOfAnUnknownSizeIsUnsupportedWithoutALine) {
  for (const std::uint32_t bits : {0U, 160U, 255U, 257U, 512U, 528U, 0xFFFFFFFFU}) {
    TEE_ObjectHandle key = TEE_HANDLE_NULL;
    keymaster_error_t error = KM_ERROR_OK;
    const ec_fields fields = {bits, {1}, {2}, {3}};
    EXPECT_EQ(ec_resolve_key_data(fields.material(), &key, nullptr, &error), TEE_SUCCESS);
    EXPECT_EQ(key, TEE_ObjectHandle{TEE_HANDLE_NULL});
    EXPECT_EQ(error, KM_ERROR_UNSUPPORTED_KEY_SIZE);
    EXPECT_TRUE(ta.errors().empty());
  }
}

}  // namespace
}  // namespace testing_support
