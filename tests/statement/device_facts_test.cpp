// A sign statement against the factory's record of its device.
#include <map>

#include "tests/statement/hand_made.h"

namespace {

using namespace hand_made;
using namespace keymaster::client;

const factory_record recorded{
    .device_id = {1}, .cpu_id = "c", .tee_n = "tn", .tee_v = "tv", .fp_n = "fn", .fp_v = "fv", .attk = ""};

/// What a statement is refused for whose device tells `told` in place of one of its facts.
std::string refusal(const std::string& member, const std::string& told, const factory_record* device) {
  std::map<std::string, std::string> facts{
      {"tee_n", "tn"}, {"tee_v", "tv"}, {"fp_n", "fn"}, {"fp_v", "fv"}, {"cpu_id", "c"}};
  facts[member] = told;
  std::string text = "{\"raw\":\"x\",\"counter\":1,\"uid\":4294967295";
  for (const char* const name : {"tee_n", "tee_v", "fp_n", "fp_v", "cpu_id"}) {
    text += ",\"" + std::string(name) + "\":\"" + facts[name] + "\"";
  }
  const bytes statement = sign_statement(text + "}", app_key());
  const auto app = rsa_public_key::from_pem(public_pem(app_key()));
  return check_that_refuses(
      [&] { (void)verify_sign_statement(statement, {.signer = app, .challenge = "x", .device = device}); });
}

TEST(DeviceFacts, AreThoseOfTheFactoryRecord) {
  EXPECT_EQ(refusal("tee_n", "tn", &recorded), "accepted");
  for (const char* const member : {"tee_n", "tee_v", "fp_n", "fp_v", "cpu_id"}) {
    for (const char* const told : {"", "other", "t", "tn ", "C"}) {
      EXPECT_EQ(refusal(member, told, &recorded), member) << told;
    }
  }
}

TEST(DeviceFacts, AreNotCheckedWithoutARecord) {
  EXPECT_EQ(refusal("cpu_id", "other", nullptr), "accepted");
}

}  // namespace
