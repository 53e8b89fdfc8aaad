// In which order a start reads the clocks, makes the key and makes the tables. The clocks are the test's own.
#include "auth/authorization.h"
#include "auth/time_base.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

std::vector<std::string> readings;

}  // namespace

// The program's own definitions go before the hosted TEE's.
void TEE_GetSystemTime(TEE_Time* time) {
  readings.emplace_back("system");
  *time = {7200, 250};
}
void TEE_GetREETime(TEE_Time* time) {
  readings.emplace_back("normal world");
  *time = {1'700'000'000, 500};
}

namespace {

class StartOrderTest : public TaUnitTest {
 protected:
  void SetUp() override { readings.clear(); }
};

// Whatever delays the second reading makes the wall clock late and never early.
TEST_F(StartOrderTest, TheSystemClockIsReadBeforeTheNormalWorlds) {
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
  EXPECT_THAT(readings, ElementsAre("system", "normal world"));
  authorizaiton_release();
}

TEST_F(StartOrderTest, AfterwardsOnlyTheSystemClockIsRead) {
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
  readings.clear();
  EXPECT_EQ(time_base_now_ms(), 1'700'000'000'500U);
  EXPECT_THAT(readings, ElementsAre("system"));
  authorizaiton_release();
}

TEST_F(StartOrderTest, TheClocksAreReadBeforeTheKeyIsMade) {
  for (const char* const call : {"TEE_AllocateTransientObject", "GetBootSeed", "TEE_PopulateTransientObject"}) {
    readings.clear();
    ta.faults().clear();
    ta.faults().fail_call(call, 1, TEE_ERROR_GENERIC);
    EXPECT_EQ(authorizaiton_init(), TEE_ERROR_GENERIC);
    EXPECT_THAT(readings, ElementsAre("system", "normal world"));
    EXPECT_EQ(ta.faults().allocations(), 0U) << "the tables come after the key";
  }
}

TEST_F(StartOrderTest, TheKeyIsMadeBeforeTheTables) {
  ta.faults().fail_allocation(1);
  EXPECT_EQ(authorizaiton_init(), TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(ta.faults().call_count("TEE_PopulateTransientObject"), 1U);
  EXPECT_EQ(ta.faults().allocations(), 1U);
}

}  // namespace
