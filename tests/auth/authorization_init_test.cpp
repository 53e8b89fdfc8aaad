// The start of authorization: what it makes, and what it leaves behind when the platform fails.
#include <fmt/format.h>

#include "auth/authorization.h"
#include "auth/token_cache.h"
#include "tests/auth/auth_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

using AuthorizationInitTest = TaUnitTest;

TEST_F(AuthorizationInitTest, AStartMakesOneKeyAndTwoTables) {
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
  const auto held = ta.holdings();
  EXPECT_EQ(held.transient_objects, 1U);
  EXPECT_EQ(held.operations, 0U);
  EXPECT_EQ(held.heap_blocks, 2U);
  // 8 entries of 2048 bytes and six words, 16 entries of a token and a byte.
  EXPECT_EQ(held.heap_bytes, 8U * (2048 + 24) + 16U * 70 + 2 * hosted_tee::instance_heap::block_overhead);
  EXPECT_THAT(ta.errors(), IsEmpty());
  authorizaiton_release();
  expect_same(ta.holdings(), {});
}

TEST_F(AuthorizationInitTest, EachClockIsReadOnceAndTheSeedOnce) {
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
  EXPECT_EQ(ta.faults().call_count("TEE_GetSystemTime"), 1U);
  EXPECT_EQ(ta.faults().call_count("TEE_GetREETime"), 1U);
  EXPECT_EQ(ta.faults().call_count("GetBootSeed"), 1U);
  authorizaiton_release();
}

TEST_F(AuthorizationInitTest, EachPlatformFailureEndsTheStartWithItsResult) {
  struct row {
    const char* call;
    const char* message;
  };
  for (const row& r : {row{"TEE_AllocateTransientObject", "AllocateTransientObject"},
                       {"GetBootSeed", "GetBootSeed"},
                       {"TEE_PopulateTransientObject", "PopulateTransientObject"}}) {
    for (const TEE_Result result : {TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_GENERIC, TEE_Result{0x12345678}}) {
      ta.clear_trace();
      ta.faults().fail_call(r.call, 1, result);
      EXPECT_EQ(authorizaiton_init(), result);
      EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("{} failed with 0x{:08x}\n", r.message, result)));
      expect_same(ta.holdings(), {});
    }
  }
}

TEST_F(AuthorizationInitTest, WithoutMemoryForATableNothingIsLeftBehind) {
  for (const std::uint32_t n : {1U, 2U}) {
    ta.clear_trace();
    ta.faults().fail_allocation(n);
    EXPECT_EQ(authorizaiton_init(), TEE_ERROR_OUT_OF_MEMORY);
    EXPECT_TRUE(ta.faults().triggered());
    EXPECT_THAT(ta.errors(), ElementsAre("Out of memory"));
    expect_same(ta.holdings(), {});
    ta.faults().clear();
  }
}

TEST_F(AuthorizationInitTest, AFailedStartCanBeRepeated) {
  ta.faults().fail_allocation(2);
  EXPECT_EQ(authorizaiton_init(), TEE_ERROR_OUT_OF_MEMORY);
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
  const bytes token = token_fields{.user_id = 1}.mint(device.boot_seed);
  EXPECT_EQ(check_auth_token_valid(token.data(), auth_token_size), 0);
  authorizaiton_release();
}

TEST_F(AuthorizationInitTest, ReleasingTwiceIsHarmless) {
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
  authorizaiton_release();
  authorizaiton_release();
  expect_same(ta.holdings(), {});
}

TEST_F(AuthorizationInitTest, KeptTokensAreWipedBeforeTheTableIsFreed) {
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
  const bytes token = token_fields{.user_id = 0x1122334455667788}.mint(device.boot_seed);
  token_cache_store(std::span<const std::uint8_t, auth_token_size>{token});
  std::size_t leaks = 0;
  ta.on_free([&](std::span<const std::uint8_t> block) { leaks += contains(block, std::span(token).last(32)); });
  authorizaiton_release();
  ta.on_free({});
  EXPECT_EQ(leaks, 0U);
}

}  // namespace
