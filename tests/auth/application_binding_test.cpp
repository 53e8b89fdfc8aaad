// Keys that are bound to an application.
#include "auth/application_binding.h"

#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

class ApplicationBindingTest : public TaUnitTest {
 protected:
  /// Whether a key of `key` may be used by who brings these bytes; 0 as of check_app_id_and_app_data.
  int check(const param_list& key, const std::string& id, const std::string& data) {
    const parameter_set set = in_ta(key);
    ta.clear_trace();
    return check_app_id_and_app_data(set, from_text(id), from_text(data));
  }
};

param_list bound_to(const std::string& id, const std::string& data) {
  return param_list{}
      .add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA)
      .add_blob(KM_TAG_APPLICATION_ID, from_text(id))
      .add_blob(KM_TAG_APPLICATION_DATA, from_text(data));
}

TEST_F(ApplicationBindingTest, TheSameIdAndDataMatch) {
  EXPECT_EQ(check(bound_to("wallet", "pin"), "wallet", "pin"), 0);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(ApplicationBindingTest, AnUnboundKeyIsForThoseWhoBringNothing) {
  const param_list unbound = param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA);
  EXPECT_EQ(check(unbound, "", ""), 0);
  EXPECT_EQ(check(unbound, "wallet", ""), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("KM_TAG_APPLICATION_ID mismatch"));
  EXPECT_EQ(check(unbound, "", "pin"), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("KM_TAG_APPLICATION_DATA mismatch"));
}

TEST_F(ApplicationBindingTest, AnEmptyBindingIsNone) {
  EXPECT_EQ(check(bound_to("", ""), "", ""), 0);
  EXPECT_EQ(check(bound_to("", ""), "x", ""), 1);
}

TEST_F(ApplicationBindingTest, EveryOtherIdIsAMismatch) {
  for (const char* const id : {"", "w", "walle", "wallets", "Wallet", "tellaw"}) {
    EXPECT_EQ(check(bound_to("wallet", "pin"), id, "pin"), 1) << id;
    EXPECT_THAT(ta.errors(), ElementsAre("KM_TAG_APPLICATION_ID mismatch"));
  }
}

TEST_F(ApplicationBindingTest, EveryOtherDataIsAMismatch) {
  for (const char* const data : {"", "p", "pi", "pins", "pan"}) {
    EXPECT_EQ(check(bound_to("wallet", "pin"), "wallet", data), 1) << data;
    EXPECT_THAT(ta.errors(), ElementsAre("KM_TAG_APPLICATION_DATA mismatch"));
  }
}

TEST_F(ApplicationBindingTest, TheIdIsComparedBeforeTheData) {
  EXPECT_EQ(check(bound_to("wallet", "pin"), "pin", "wallet"), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("KM_TAG_APPLICATION_ID mismatch"));
}

TEST_F(ApplicationBindingTest, ARepeatedBindingMatchesNobody) {
  EXPECT_EQ(check(bound_to("wallet", "pin").add_blob(KM_TAG_APPLICATION_ID, from_text("wallet")), "wallet", "pin"), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("Duplicated KM_TAG_APPLICATION_ID"));
  EXPECT_EQ(check(bound_to("wallet", "pin").add_blob(KM_TAG_APPLICATION_DATA, from_text("x")), "wallet", "pin"), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("Duplicated KM_TAG_APPLICATION_DATA"));
}

TEST_F(ApplicationBindingTest, ARepeatedBindingDoesNotMatchThoseWhoBringNothing) {
  const param_list twice = param_list{}.add_blob(KM_TAG_APPLICATION_ID, {}).add_blob(KM_TAG_APPLICATION_ID, {});
  EXPECT_EQ(check(twice, "", ""), 1);
  EXPECT_THAT(ta.errors(), ElementsAre("Duplicated KM_TAG_APPLICATION_ID"));
}

}  // namespace
