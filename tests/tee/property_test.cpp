// Properties of the three sets, typed and as text.
#include <gmock/gmock.h>

#include <cstring>

#include "tee/runtime/uuid.h"
#include "tests/tee/scoped_instance.h"

namespace hosted_tee::testing {
namespace {

constexpr std::array<tee_ta_property, 4> table{{
    {"gpd.ta.singleInstance", TEE_TA_PROPERTY_BOOL, 1, nullptr},
    {"gpd.ta.dataSize", TEE_TA_PROPERTY_U32, 0x80000, nullptr},
    {"gpd.ta.version", TEE_TA_PROPERTY_STRING, 0, "Undefined version"},
    {nullptr, 0, 0, nullptr},
}};

class PropertyTest : public ::testing::Test {
 protected:
  PropertyTest() { ta.self().properties = table.data(); }

  static std::string text(TEE_PropSetHandle set, const char* name) {
    std::array<char, 128> buffer{};
    std::uint32_t length = buffer.size();
    const TEE_Result result = TEE_GetPropertyAsString(set, name, buffer.data(), &length);
    if (result != TEE_SUCCESS) return "error";
    EXPECT_EQ(length, std::strlen(buffer.data()) + 1);
    return buffer.data();
  }

  scoped_instance ta;
};

TEST_F(PropertyTest, TheTasOwnComeFromItsTable) {
  bool single = false;
  std::uint32_t size = 0;
  EXPECT_EQ(TEE_GetPropertyAsBool(TEE_PROPSET_CURRENT_TA, "gpd.ta.singleInstance", &single), TEE_SUCCESS);
  EXPECT_TRUE(single);
  EXPECT_EQ(TEE_GetPropertyAsU32(TEE_PROPSET_CURRENT_TA, "gpd.ta.dataSize", &size), TEE_SUCCESS);
  EXPECT_EQ(size, 0x80000U);
  EXPECT_EQ(text(TEE_PROPSET_CURRENT_TA, "gpd.ta.version"), "Undefined version");
  EXPECT_EQ(text(TEE_PROPSET_CURRENT_TA, "gpd.ta.singleInstance"), "true");
  EXPECT_EQ(text(TEE_PROPSET_CURRENT_TA, "gpd.ta.dataSize"), "524288");
  EXPECT_EQ(text(TEE_PROPSET_CURRENT_TA, "gpd.ta.appID"), "00000000-0000-0000-0000-000000000000");
}

TEST_F(PropertyTest, AbsentNamesAndOtherTypesAreToldApart) {
  std::uint32_t number = 0;
  bool flag = false;
  EXPECT_EQ(TEE_GetPropertyAsU32(TEE_PROPSET_CURRENT_TA, "gpd.ta.none", &number), TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(TEE_GetPropertyAsBool(TEE_PROPSET_CURRENT_TA, "gpd.ta.dataSize", &flag), TEE_ERROR_BAD_FORMAT);
  EXPECT_EQ(TEE_GetPropertyAsU32(TEE_PROPSET_CURRENT_CLIENT, "gpd.ta.dataSize", &number), TEE_ERROR_ITEM_NOT_FOUND);
}

TEST_F(PropertyTest, AShortBufferLearnsTheSizeThatIsNeeded) {
  std::array<char, 17> buffer{};
  std::uint32_t length = buffer.size();
  EXPECT_EQ(TEE_GetPropertyAsString(TEE_PROPSET_CURRENT_TA, "gpd.ta.version", buffer.data(), &length),
            TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(length, 18U);
}

TEST_F(PropertyTest, TheDeviceIdentifierIsAUuid) {
  ta.device().id = {0x01020304, 0x0506, 0x0708, {9, 10, 11, 12, 13, 14, 15, 16}};
  TEE_UUID id{};
  EXPECT_EQ(TEE_GetPropertyAsUUID(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.deviceID", &id), TEE_SUCCESS);
  EXPECT_TRUE(same_uuid(id, ta.device().id));
  EXPECT_EQ(text(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.deviceID"), "01020304-0506-0708-090a-0b0c0d0e0f10");
}

TEST_F(PropertyTest, TheImplementationTellsItsStandardAndMaker) {
  EXPECT_EQ(text(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.apiversion"), "1.1");
  EXPECT_EQ(text(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.internalCore.version"), "16843264");
  for (const char* name : {"gpd.tee.trustedos.manufacturer", "gpd.tee.trustedos.implementation.version"}) {
    EXPECT_NE(text(TEE_PROPSET_TEE_IMPLEMENTATION, name), "error") << name;
  }
  ta.device().text_properties["gpd.tee.trustedos.manufacturer"] = "somebody else";
  EXPECT_EQ(text(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.trustedos.manufacturer"), "somebody else");
}

TEST_F(PropertyTest, BinaryBlocksAreBase64AsText) {
  constexpr const char* name = "gpd.tee.trustedos.implementation.binaryversion";
  std::array<char, 64> block{};
  std::uint32_t length = block.size();
  ASSERT_EQ(TEE_GetPropertyAsBinaryBlock(TEE_PROPSET_TEE_IMPLEMENTATION, name, block.data(), &length), TEE_SUCCESS);
  EXPECT_EQ(std::string(block.data(), length),
            text(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.trustedos.implementation.version"));
  EXPECT_EQ(text(TEE_PROPSET_TEE_IMPLEMENTATION, name).size(), (length + 2) / 3 * 4);
}

TEST_F(PropertyTest, WhatIsNotThereHasTheLevelZero) {
  for (const char* name : {"gpd.tee.trustedStorage.antiRollback.protectionLevel", "gpd.tee.arith.maxBigIntSize"}) {
    std::uint32_t number = 77;
    EXPECT_EQ(TEE_GetPropertyAsU32(TEE_PROPSET_TEE_IMPLEMENTATION, name, &number), TEE_SUCCESS) << name;
    EXPECT_EQ(number, 0U) << name;
  }
}

TEST_F(PropertyTest, TheClientsIdentityIsItsLoginAndUuid) {
  ta.self().client = {TEE_LOGIN_USER, {0xABCDEF01, 2, 3, {4, 5, 6, 7, 8, 9, 10, 11}}};
  TEE_Identity identity{};
  EXPECT_EQ(TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", &identity), TEE_SUCCESS);
  EXPECT_EQ(identity.login, TEE_LOGIN_USER);
  EXPECT_EQ(text(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity"), "1:abcdef01-0002-0003-0405-060708090a0b");
  ta.self().client = {TEE_LOGIN_PUBLIC, {}};
  EXPECT_EQ(text(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity"), "0");
}

TEST_F(PropertyTest, InventedSetsAndNullNamesPanic) {
  EXPECT_TRUE(run_guarded([] {
                std::uint32_t n = 0;
                (void)TEE_GetPropertyAsU32(nullptr, "gpd.ta.dataSize", &n);
              }).has_value());
  EXPECT_TRUE(run_guarded([] {
                std::uint32_t n = 0;
                (void)TEE_GetPropertyAsU32(TEE_PROPSET_CURRENT_TA, nullptr, &n);
              }).has_value());
}

TEST_F(PropertyTest, AFailedCallLeavesNoLength) {
  ta.faults().fail_call("TEE_GetPropertyAsString", 1, TEE_ERROR_GENERIC);
  std::uint32_t length = 64;
  EXPECT_EQ(TEE_GetPropertyAsString(TEE_PROPSET_CURRENT_TA, "gpd.ta.version", nullptr, &length), TEE_ERROR_GENERIC);
  EXPECT_EQ(length, 0U);
}

TEST(Uuid, ReadsItsOwnTextInEitherCaseAndNothingElse) {
  const TEE_UUID uuid = random_uuid();
  EXPECT_EQ(uuid.timeHiAndVersion >> 12, 4);
  EXPECT_EQ(uuid.clockSeqAndNode[0] >> 6, 2);
  EXPECT_TRUE(same_uuid(*parse_uuid(to_text(uuid)), uuid));
  EXPECT_TRUE(parse_uuid("FBACEA43-F475-4DF3-866F-76256ABA994F").has_value());
  for (const char* wrong : {"", "fbacea43-f475-4df3-866f-76256aba994", "fbacea43-f475-4df3-866f-76256aba994fa",
                            "fbacea43f-475-4df3-866f-76256aba994f", "gbacea43-f475-4df3-866f-76256aba994f"}) {
    EXPECT_FALSE(parse_uuid(wrong).has_value()) << wrong;
  }
}

TEST(Uuid, NamesGiveTheSameVersionFiveUuidEveryTime) {
  const TEE_UUID uuid = named_uuid("uid=0;");
  EXPECT_EQ(uuid.timeHiAndVersion >> 12, 5);
  EXPECT_TRUE(same_uuid(uuid, named_uuid("uid=0;")));
  EXPECT_FALSE(same_uuid(uuid, named_uuid("uid=1;")));
}

}  // namespace
}  // namespace hosted_tee::testing
