// The entry points called directly, for what a platform between client and TA would not let through.
#include <fmt/format.h>
#include <gmock/gmock.h>

#include "params/keymaster_protocol.h"
#include "ta/dispatch.h"
#include "tests/commands/raw_session.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using hosted_tee::trace_level;

namespace testing_support {
namespace {

class EntryTest : public TaUnitTest {
 protected:
  void SetUp() override { device.id = {0x01234567, 0x89AB, 0xCDEF, {1, 2, 3, 4, 5, 6, 7, 8}}; }

  /// What a start leaves behind for as long as the instance lives: the key storage key.
  void end() {
    TA_DestroyEntryPoint();
    EXPECT_EQ(ta.holdings().heap_blocks, 0U);
    EXPECT_EQ(ta.holdings().transient_objects, started_ ? 1U : 0U);
  }
  void start() {
    ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
    started_ = true;
  }
  void TearDown() override {}  // the platform reclaims what an instance holds at its end

  TEE_Result invoke(std::uint32_t command, std::uint32_t types, TEE_Param (&params)[4]) {
    return TA_InvokeCommandEntryPoint(nullptr, command, types, params);
  }

 private:
  bool started_ = false;
};

TEST_F(EntryTest, StatusSlotsThatAPlatformDoesNotClearAreRefused) {
  for (const std::uint32_t command : {KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, KM_COMMAND_SOTER_GET_DEVICE_ID}) {
    for (const auto& [a, b] : {std::pair{1U, 0U}, {0U, 1U}, {7U, 9U}}) {
      bytes response(32, 0xA5);
      TEE_Param params[4] = {values(a, b), {}, memref(response), {}};
      ta.clear_trace();
      EXPECT_EQ(invoke(command, status_and_response, params), TEE_ERROR_BAD_PARAMETERS);
      EXPECT_EQ(ta.errors(), (std::vector<std::string>{"Bad argument\n"}));
      EXPECT_EQ(params[0].value.a, a);
      EXPECT_EQ(params[0].value.b, b);
      EXPECT_EQ(params[2].memref.size, 32U);
      EXPECT_EQ(response, bytes(32, 0xA5));
    }
  }
}

TEST_F(EntryTest, TypesBeyondTheFourSlotsAreWrongTypes) {
  TEE_Param params[4] = {};
  EXPECT_EQ(invoke(KM_COMMAND_DELETE_ALL_KEY, 0x10003, params), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(ta.errors(), (std::vector<std::string>{"Bad argument type\n"}));
}

TEST_F(EntryTest, TheSessionContextIsTracedAndLeftAlone) {
  int nothing = 0;
  void* context = &nothing;
  TEE_Param none[4] = {};
  EXPECT_EQ(TA_OpenSessionEntryPoint(0x7777, none, &context), TEE_SUCCESS);
  EXPECT_EQ(context, &nothing);
  ta.clear_trace();
  EXPECT_EQ(TA_InvokeCommandEntryPoint(context, 0, 0, none), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_THAT(ta.traced(trace_level::info),
              testing::ElementsAre(fmt::format(
                  "TA_InvokeCommandEntryPoint nCommandID 0x0 pSessionContext {} nParamTypes 0x0\n", context)));
  ta.clear_trace();
  TA_CloseSessionEntryPoint(context);
  EXPECT_TRUE(device.trace.lines().empty());
}

TEST_F(EntryTest, EndingAnInstanceGivesBackWhatAuthorizationHeld) {
  start();
  EXPECT_EQ(ta.holdings().heap_blocks, 2U);        // use log and token cache
  EXPECT_EQ(ta.holdings().transient_objects, 2U);  // key storage key and token key
  end();
}

TEST_F(EntryTest, AFailedStartHoldsNothing) {
  for (const std::uint32_t n : {1U, 2U}) {
    ta.faults().fail_allocation(n);
    EXPECT_EQ(TA_CreateEntryPoint(), TEE_ERROR_OUT_OF_MEMORY);
    expect_same(ta.holdings(), {});
  }
  ta.faults().fail_call("GetBootSeed", 1, TEE_ERROR_GENERIC);
  EXPECT_EQ(TA_CreateEntryPoint(), TEE_ERROR_GENERIC);
  expect_same(ta.holdings(), {});
}

TEST_F(EntryTest, ASecondInstanceInTheSameMemoryStartsClean) {
  const bytes params = rsa_key(512).marshal();
  TEE_Param slots[4] = {};
  bytes request = params, blob(4096);
  start();
  slots[1] = memref(request);
  slots[2] = memref(blob);
  ASSERT_EQ(invoke(KM_COMMAND_GENERATE_KEY, with_both, slots), TEE_SUCCESS);
  blob.resize(slots[2].memref.size);

  const auto begin = [&](std::uint32_t* handle) {
    bytes body = join({prefixed(blob), prefixed(signature(KM_DIGEST_NONE, KM_PAD_NONE).marshal())}), response(64);
    TEE_Param begin_slots[4] = {values(KM_PURPOSE_SIGN, 0), memref(body), memref(response), {}};
    const TEE_Result result = invoke(KM_COMMAND_BEGIN, with_both, begin_slots);
    *handle = begin_slots[0].value.b;
    return result == TEE_SUCCESS && begin_slots[0].value.a == 0;
  };
  std::uint32_t handle = 0;
  for (int i = 0; i < 16; ++i) ASSERT_TRUE(begin(&handle));
  EXPECT_FALSE(begin(&handle));

  // The operations go with the instance, which the platform reclaims; the image's memory stays here.
  TA_DestroyEntryPoint();
  start();
  for (int i = 0; i < 16; ++i) EXPECT_TRUE(begin(&handle)) << i;
  TA_DestroyEntryPoint();
}

}  // namespace
}  // namespace testing_support
