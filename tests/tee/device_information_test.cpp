// The TA "device information": what it tells a client, and what it refuses.
#include <gmock/gmock.h>

#include <algorithm>
#include <fstream>

#include "tee/client/device_information.h"
#include "tee/runtime/uuid.h"
#include "tests/tee/world_fixture.h"

namespace hosted_tee::testing {
namespace {

constexpr TEE_UUID information_ta = DEVICE_INFORMATION_TA_UUID;
const TEE_UUID counting_ta = *parse_uuid("11d0a5d2-6f0c-4f3e-9d0e-0d6a5b1c2e01");

constexpr std::uint32_t tee_property_types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT,
                                                             TEE_PARAM_TYPE_NONE, TEE_PARAM_TYPE_NONE);
constexpr std::uint32_t ta_property_types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_INPUT,
                                                            TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_NONE);
constexpr std::uint32_t state_types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_OUTPUT, TEE_PARAM_TYPE_VALUE_OUTPUT,
                                                      TEE_PARAM_TYPE_VALUE_OUTPUT, TEE_PARAM_TYPE_NONE);

/// What a property command answered: its result, the size that the slot has afterwards, and the bytes in it.
struct told {
  TEE_Result result;
  std::uint32_t size;
  std::string value;

  friend bool operator==(const told&, const told&) = default;
};

told value(const std::string& text) {
  return {TEE_SUCCESS, static_cast<std::uint32_t>(text.size() + 1), text + '\0'};
}
told refusal(TEE_Result result, std::uint32_t size = 0) {
  return {result, size, ""};
}

class DeviceInformationTest : public WorldTest {
 protected:
  DeviceInformationTest() {
    options.ta_folder = TEST_TA_FOLDER;
    restart();
  }
  void restart() {
    start();
    session = must_open(information_ta);
  }

  static TEE_Param memory(std::string& bytes) {
    TEE_Param slot{};
    slot.memref.buffer = bytes.data();
    slot.memref.size = static_cast<std::uint32_t>(bytes.size());
    return slot;
  }

  told ask(std::uint32_t command, std::uint32_t types, std::array<TEE_Param, 4> params, std::size_t place,
           std::uint32_t capacity) {
    std::string room(capacity, '?');
    params[place] = memory(room);
    told answer{};
    answer.result = invoke(session, command, types, params.data()).result;
    answer.size = params[place].memref.size;
    if (answer.result == TEE_SUCCESS) answer.value = room.substr(0, answer.size);
    EXPECT_TRUE(answer.result == TEE_SUCCESS || room == std::string(capacity, '?')) << "a refusal wrote a value";
    return answer;
  }
  told tee_property(std::string name, std::uint32_t capacity = 200) {
    return ask(DEVICE_INFORMATION_GET_TEE_PROPERTY, tee_property_types, {memory(name)}, 1, capacity);
  }
  told ta_property(const TEE_UUID& ta, std::string name, std::uint32_t capacity = 200) {
    const uuid_bytes bytes = to_bytes(ta);
    return ta_property(std::string(bytes.begin(), bytes.end()), std::move(name), capacity);
  }
  told ta_property(std::string uuid, std::string name, std::uint32_t capacity = 200) {
    return ask(DEVICE_INFORMATION_GET_TA_PROPERTY, ta_property_types, {memory(uuid), memory(name)}, 2, capacity);
  }
  std::array<TEE_Param, 4> state() {
    std::array<TEE_Param, 4> params{};
    EXPECT_EQ(invoke(session, DEVICE_INFORMATION_GET_STATE, state_types, params.data()).result, TEE_SUCCESS);
    return params;
  }

  std::uint32_t session = 0;
};

TEST_F(DeviceInformationTest, TellsThePropertiesOfTheTee) {
  options.device_id = TEE_UUID{0x01020304, 0x0506, 0x4708, {0x89, 10, 11, 12, 13, 14, 15, 16}};
  restart();
  world->device().text_properties["gpd.tee.trustedos.manufacturer"] = "somebody";
  EXPECT_EQ(tee_property("gpd.tee.deviceID"), value("01020304-0506-4708-890a-0b0c0d0e0f10"));
  EXPECT_EQ(tee_property("gpd.tee.trustedos.manufacturer"), value("somebody"));
  EXPECT_EQ(tee_property("gpd.tee.apiversion"), value("1.1"));
  EXPECT_EQ(tee_property("gpd.tee.cryptography.ecc"), value("true"));
}

TEST_F(DeviceInformationTest, TellsThePropertiesOfATaWithoutRunningIt) {
  EXPECT_EQ(ta_property(counting_ta, "gpd.ta.dataSize"), value("1024"));
  EXPECT_EQ(ta_property(counting_ta, "gpd.ta.appID"), value(to_text(counting_ta)));
  EXPECT_FALSE(world->has_instance(counting_ta));
  EXPECT_TRUE(world->trace().lines().empty());
}

TEST_F(DeviceInformationTest, TellsThePropertiesOfATaThatRunsAndLeavesItAlone) {
  const std::uint32_t counting = must_open(counting_ta);
  std::array<TEE_Param, 4> params{};
  for (std::uint32_t count = 1; count < 4; ++count) {
    EXPECT_EQ(ta_property(counting_ta, "gpd.ta.dataSize"), value("1024"));
    EXPECT_EQ(invoke(counting, 0, TEE_PARAM_TYPE_VALUE_OUTPUT, params.data()).result, TEE_SUCCESS);
    EXPECT_EQ(params[0].value.a, count);
  }
}

TEST_F(DeviceInformationTest, TellsThePropertiesOfTasWithoutAnImage) {
  EXPECT_EQ(ta_property(first_ta::uuid, "gpd.ta.description"), value("a scripted TA"));
  EXPECT_EQ(ta_property(information_ta, "gpd.ta.singleInstance"), value("true"));
  EXPECT_EQ(ta_property(information_ta, "gpd.ta.instanceKeepAlive"), value("false"));
}

TEST_F(DeviceInformationTest, WhatIsNotThereIsNotFound) {
  EXPECT_EQ(tee_property("gpd.tee.none"), refusal(TEE_ERROR_ITEM_NOT_FOUND));
  EXPECT_EQ(tee_property("gpd.ta.dataSize"), refusal(TEE_ERROR_ITEM_NOT_FOUND));
  EXPECT_EQ(ta_property(counting_ta, "gpd.ta.none"), refusal(TEE_ERROR_ITEM_NOT_FOUND));
  EXPECT_EQ(ta_property(counting_ta, "gpd.tee.apiversion"), refusal(TEE_ERROR_ITEM_NOT_FOUND));
  EXPECT_EQ(ta_property(TEE_UUID{}, "gpd.ta.dataSize"), refusal(TEE_ERROR_ITEM_NOT_FOUND));
}

TEST_F(DeviceInformationTest, AFileThatIsNotAnImageOfTheTaIsABadFormatAndTheTraceTellsWhy) {
  options.ta_folder = folder.path();
  restart();
  std::ofstream(folder.path() / (to_text(counting_ta) + ".ta")) << "not an image";
  EXPECT_EQ(ta_property(counting_ta, "gpd.ta.dataSize"), refusal(TEE_ERROR_BAD_FORMAT));
  const auto line = world->trace().lines().back();
  EXPECT_EQ(line.level, trace_level::error);
  EXPECT_THAT(line.text, ::testing::StartsWith("the TA " + to_text(counting_ta) + " can't be read: "));
}

TEST_F(DeviceInformationTest, ASlotThatIsTooSmallLearnsTheSizeThatIsNeeded) {
  for (const std::uint32_t capacity : {0U, 3U}) {
    EXPECT_EQ(tee_property("gpd.tee.apiversion", capacity), refusal(TEE_ERROR_SHORT_BUFFER, 4)) << capacity;
    EXPECT_EQ(ta_property(counting_ta, "gpd.ta.dataSize", capacity), refusal(TEE_ERROR_SHORT_BUFFER, 5)) << capacity;
  }
  EXPECT_EQ(tee_property("gpd.tee.apiversion", 4), value("1.1"));
  EXPECT_EQ(ta_property(counting_ta, "gpd.ta.dataSize", 5), value("1024"));
}

TEST_F(DeviceInformationTest, ANullSlotCountsAsEmptyWhateverItsSize) {
  std::string name = "gpd.tee.apiversion";
  std::array<TEE_Param, 4> params{memory(name)};
  params[1].memref.size = 100;
  EXPECT_EQ(invoke(session, DEVICE_INFORMATION_GET_TEE_PROPERTY, tee_property_types, params.data()).result,
            TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(params[1].memref.size, 4U);
  params[0].memref = {nullptr, 18};
  EXPECT_EQ(invoke(session, DEVICE_INFORMATION_GET_TEE_PROPERTY, tee_property_types, params.data()).result,
            TEE_ERROR_BAD_PARAMETERS);
}

TEST_F(DeviceInformationTest, NamesAndUuidsHaveOneForm) {
  const std::string longest(device_information_name_limit, 'n');
  EXPECT_EQ(tee_property(longest), refusal(TEE_ERROR_ITEM_NOT_FOUND));
  for (const std::string& name : {std::string(), longest + 'n', std::string("gpd.tee.apiversion\0", 19),
                                  std::string("gpd.tee\0.apiversion", 19), std::string(1 << 20, 'n')}) {
    EXPECT_EQ(tee_property(name), refusal(TEE_ERROR_BAD_PARAMETERS)) << name.size();
    EXPECT_EQ(ta_property(counting_ta, name), refusal(TEE_ERROR_BAD_PARAMETERS)) << name.size();
  }
  for (const std::size_t size : {0U, 15U, 17U, 36U}) {
    EXPECT_EQ(ta_property(std::string(size, '\x11'), "gpd.ta.dataSize"), refusal(TEE_ERROR_BAD_PARAMETERS)) << size;
  }
}

TEST_F(DeviceInformationTest, OtherTypesAndCommandsAreRefusedAndNothingPanics) {
  std::array<TEE_Param, 4> params{};
  for (std::uint32_t types = 0; types <= 0xFFFF; ++types) {
    for (const auto& [command, own] : {std::pair{DEVICE_INFORMATION_GET_TEE_PROPERTY, tee_property_types},
                                       std::pair{DEVICE_INFORMATION_GET_TA_PROPERTY, ta_property_types},
                                       std::pair{DEVICE_INFORMATION_GET_STATE, state_types}}) {
      if (types == own) continue;
      ASSERT_EQ(invoke(session, command, types, params.data()).result, TEE_ERROR_BAD_PARAMETERS);
    }
  }
  for (const std::uint32_t command : {0U, 4U, 0xFFFFFFFFU}) {
    EXPECT_EQ(invoke(session, command, 0, params.data()), (reply{TEE_ERROR_NOT_SUPPORTED, TEE_ORIGIN_TRUSTED_APP, 0}));
  }
  EXPECT_EQ(open(information_ta, TEE_PARAM_TYPE_VALUE_INPUT, params.data()).result, TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(tee_property("gpd.tee.apiversion"), value("1.1"));
}

TEST_F(DeviceInformationTest, TellsBothClocks) {
  world->clock().set_system({7201, 2});
  world->clock().set_ree({1'700'000'000, 999});
  const auto told = state();
  EXPECT_EQ(told[1].value.a, 7201U);
  EXPECT_EQ(told[1].value.b, 2U);
  EXPECT_EQ(told[2].value.a, 1'700'000'000U);
  EXPECT_EQ(told[2].value.b, 999U);
}

TEST_F(DeviceInformationTest, TellsWhetherTheRpmbStorageCanBeUsed) {
  EXPECT_EQ(state()[0].value.a, 1U);
  world->faults().fail_call("TEE_RPMB_MakeFileSystem", 1, TEE_ERROR_SECURITY);
  EXPECT_EQ(state()[0].value.a, 0U);
  EXPECT_EQ(state()[0].value.a, 1U);
  options.rpmb = false;
  restart();
  EXPECT_EQ(state()[0].value.a, 0U);
  EXPECT_EQ(state()[0].value.b, 0U);
}

TEST_F(DeviceInformationTest, AFailingPlatformIsTheAnswer) {
  world->faults().fail_call("TEE_GetPropertyAsString", 1, TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(tee_property("gpd.tee.apiversion"), refusal(TEE_ERROR_OUT_OF_MEMORY));
  world->faults().fail_call("get_ta_property", 1, TEE_ERROR_GENERIC);
  EXPECT_EQ(ta_property(counting_ta, "gpd.ta.dataSize"), refusal(TEE_ERROR_GENERIC));
}

TEST_F(DeviceInformationTest, ItHoldsNothingAndEndsWithItsLastSession) {
  (void)tee_property("gpd.tee.apiversion");
  (void)ta_property(counting_ta, "gpd.ta.dataSize");
  (void)state();
  const accounting held = world->account(information_ta);
  EXPECT_EQ(held.heap_peak, 0U);
  EXPECT_EQ(held.transient_objects + held.persistent_objects + held.operations, 0U);
  world->close_session(must_open(information_ta));
  EXPECT_TRUE(world->has_instance(information_ta));
  world->close_session(session);
  EXPECT_FALSE(world->has_instance(information_ta));
}

}  // namespace
}  // namespace hosted_tee::testing
