// A start whose operation pool fails. Today's pool can't, so this program has one of its own.
#include <gmock/gmock.h>

#include "auth/operation_pool.h"
#include "ta/dispatch.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using ::testing::ElementsAre;

namespace {
TEE_Result pool_result = TEE_SUCCESS;
}

// The program's own definitions go before those of the TA's library.
namespace keymaster {

TEE_Result operation_pool_init() {
  return pool_result;
}
TEE_Result operation_pool_add(keymaster_operation_t*, uint32_t*, keymaster_error_t*) {
  return TEE_ERROR_NOT_IMPLEMENTED;
}
void operation_pool_remove(uint32_t) {}
keymaster_operation_t* operation_pool_get(uint32_t) {
  return nullptr;
}

}  // namespace keymaster

namespace testing_support {
namespace {

using PoolFailureTest = TaUnitTest;

TEST_F(PoolFailureTest, APoolThatFailsEndsTheStartBeforeAuthorizationAndGivesTheKeyStorageKeyBack) {
  for (const TEE_Result result : {TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_GENERIC, TEE_Result{0xF0101234}}) {
    pool_result = result;
    ta.clear_trace();
    ta.faults().clear();
    EXPECT_EQ(TA_CreateEntryPoint(), result);
    // The device of the test has no RPMB storage, which is no reason not to start.
    EXPECT_THAT(ta.errors(), ElementsAre("TEE_RPMB_MakeFileSystem return 0xffff000a", "Init operation pool failed"));
    EXPECT_EQ(ta.faults().call_count("TEE_GetPropertyAsUUID"), 1U) << "the key store comes first";
    EXPECT_EQ(ta.faults().call_count("TEE_GetSystemTime"), 0U);
    EXPECT_EQ(ta.faults().call_count("GetBootSeed"), 0U);
    EXPECT_EQ(ta.faults().allocations(), 0U);
    expect_same(ta.holdings(), {});
  }
}

}  // namespace
}  // namespace testing_support
