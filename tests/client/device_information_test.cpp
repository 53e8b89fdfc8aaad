// What the library asks the TA "device information", and what kmctl info makes of a TEE without it.
#include "client/lib/device_information.h"

#include <gtest/gtest.h>

#include "client/kmctl/device_properties.h"
#include "client/lib/wire.h"
#include "src/params/keymaster_protocol.h"
#include "tests/client/fake_tee.h"

namespace {

using namespace keymaster::client;
using namespace std::string_literals;

constexpr std::uint32_t information_ta = 0x4ed21263;
constexpr TEEC_UUID keymaster_ta = KEYMASTER_TA_UUID;

class DeviceInformationClientTest : public testing::Test {
 protected:
  void SetUp() override {
    fake_tee::reset();
    tee.emplace("embedded:/nowhere");
  }
  void TearDown() override {
    tee.reset();
    EXPECT_EQ(fake_tee::now().open_sessions, 0);
    EXPECT_EQ(fake_tee::now().open_contexts, 0);
  }

  static bytes as_answer(const std::string& text) { return {text.begin(), text.end()}; }
  static void prepare(const fake_tee::answer& answer) { fake_tee::now().answers.push_back(answer); }

  std::optional<connection> tee;
};

TEST_F(DeviceInformationClientTest, ATaIsNamedByTheBytesOfItsUuidAndTheProperty) {
  prepare({.body = as_answer("524288\0"s)});
  EXPECT_EQ(device_information(*tee).ta_property(keymaster_ta, "gpd.ta.dataSize"), "524288");
  const auto& arrived = fake_tee::now().arrivals.at(0);
  EXPECT_EQ(arrived.command, 2U);
  EXPECT_EQ(arrived.types, 0x0655U);
  EXPECT_EQ(arrived.first,
            (bytes{0xfb, 0xac, 0xea, 0x43, 0xf4, 0x75, 0x4d, 0xf3, 0x86, 0x6f, 0x76, 0x25, 0x6a, 0xba, 0x99, 0x4f}));
  EXPECT_EQ(arrived.request, as_answer("gpd.ta.dataSize"));
}

TEST_F(DeviceInformationClientTest, ALongValueIsAskedForAgainWithTheRoomItNeeds) {
  const std::string text(300, 'x');
  prepare({.body = as_answer(text + '\0'), .result = TEEC_ERROR_SHORT_BUFFER});
  prepare({.body = as_answer(text + '\0')});
  EXPECT_EQ(device_information(*tee).ta_property(keymaster_ta, "name"), text);
  ASSERT_EQ(fake_tee::now().arrivals.size(), 2U);
  EXPECT_EQ(fake_tee::now().arrivals[0].capacity, 256U);
  EXPECT_EQ(fake_tee::now().arrivals[1].capacity, 301U);
}

TEST_F(DeviceInformationClientTest, AbsentPropertiesAreNothingAndOtherRefusalsAreErrors) {
  device_information information(*tee);
  prepare({.result = TEEC_ERROR_ITEM_NOT_FOUND});
  EXPECT_EQ(information.ta_property(keymaster_ta, "none"), std::nullopt);
  prepare({.result = TEEC_ERROR_TARGET_DEAD, .origin = TEEC_ORIGIN_TEE});
  try {
    (void)information.ta_property(keymaster_ta, "name");
    FAIL();
  } catch (const error& refused) {
    EXPECT_EQ(refused.kind(), error_kind::companion);
    EXPECT_EQ(refused.facts().step, "get_ta_property");
    EXPECT_EQ(refused.facts().tee_result, TEEC_ERROR_TARGET_DEAD);
    EXPECT_EQ(refused.facts().tee_origin, TEEC_ORIGIN_TEE);
  }
  prepare({.result = TEEC_ERROR_TARGET_DEAD});
  EXPECT_THROW((void)information.state(), error);
}

TEST_F(DeviceInformationClientTest, ASizeThatMakesNoSenseIsAFormatError) {
  device_information information(*tee);
  for (const std::size_t size : {std::size_t{0}, std::size_t{256}, std::size_t{1} << 20}) {
    prepare({.body = bytes(size), .result = TEEC_ERROR_SHORT_BUFFER});
    EXPECT_THROW((void)information.ta_property(keymaster_ta, "name"), format_error) << size;
  }
}

TEST_F(DeviceInformationClientTest, ATeeWithoutTheTaIsToldAndNoError) {
  fake_tee::now().absent_ta = information_ta;
  EXPECT_THROW(device_information{*tee}, error);
  const auto properties = kmctl::read_properties(*tee, keymaster_ta);
  EXPECT_FALSE(properties.state.has_value());
  EXPECT_TRUE(fake_tee::now().arrivals.empty());
  const std::string line =
      "\n  properties are not available: this TEE offers no TA that tells them (TEE_ERROR_ITEM_NOT_FOUND)";
  EXPECT_EQ(kmctl::tee_text(properties), line);
  EXPECT_EQ(kmctl::ta_text(properties), line);
  EXPECT_EQ(kmctl::properties_json(properties), nlohmann::ordered_json::parse(R"({"tee_properties": null,
    "ta_properties": null, "rpmb": null, "system_time_ms": null, "ree_time": null})"));
}

TEST_F(DeviceInformationClientTest, AbsentPropertiesAreShownAsSuch) {
  kmctl::device_properties properties;
  properties.state = device_state{.has_rpmb = false, .system_time = 7'200'005, .ree_time = 1'700'000'000'500};
  properties.tee = {{"gpd.tee.apiversion", "1.1"}};
  properties.ta = {{"gpd.ta.version", std::nullopt}};
  EXPECT_EQ(kmctl::tee_text(properties),
            "\n  gpd.tee.apiversion                        1.1"
            "\n  RPMB storage                              no"
            "\n  system time                               7200.005 s"
            "\n  REE time                                  2023-11-14T22:13:20.500Z");
  EXPECT_EQ(kmctl::ta_text(properties), "\n  gpd.ta.version                            (none)");
  EXPECT_EQ(kmctl::properties_json(properties), nlohmann::ordered_json::parse(R"({
    "tee_properties": {"gpd.tee.apiversion": "1.1"}, "ta_properties": {"gpd.ta.version": null}, "rpmb": false,
    "system_time_ms": 7200005, "ree_time": "2023-11-14T22:13:20.500Z"})"));
}

}  // namespace
