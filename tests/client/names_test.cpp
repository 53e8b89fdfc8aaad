#include "client/lib/names.h"

#include <gtest/gtest.h>

#include <set>

#include "client/lib/error.h"
#include "src/params/keymaster_protocol.h"
#include "tee_client_api.h"

namespace {

using namespace keymaster;
using namespace keymaster::client;

TEST(Names, ErrorsAndResultsHaveTheirPublicNames) {
  EXPECT_EQ(keymaster_error_name(0), "KM_ERROR_OK");
  EXPECT_EQ(keymaster_error_name(-33), "KM_ERROR_INVALID_KEY_BLOB");
  EXPECT_EQ(keymaster_error_name(-17), "KM_ERROR_UNSUPPORTED_KEY_FORMAT");
  EXPECT_EQ(keymaster_error_name(-58), "KM_ERROR_MISSING_MIN_MAC_LENGTH");
  EXPECT_EQ(keymaster_error_name(-1000), "KM_ERROR_UNKNOWN_ERROR");
  EXPECT_EQ(tee_result_name(0), "TEE_SUCCESS");
  EXPECT_EQ(tee_result_name(0xFFFF3071), "TEE_ERROR_MAC_INVALID");
  EXPECT_EQ(tee_result_name(0xF0100001), "KSK_ERROR_DELETED");
  EXPECT_EQ(tee_result_name(0xF0100003), "KSK_ERROR_RPMB_GONE");
  EXPECT_EQ(tee_origin_name(TEEC_ORIGIN_TRUSTED_APP), "TRUSTED_APP");
  EXPECT_EQ(command_name(KM_COMMAND_GENERATE_KEY), "generate_key");
}

TEST(Names, ANumberWithoutANameIsShownAsANumber) {
  EXPECT_EQ(keymaster_error_name(-7777), "KM_ERROR(-7777)");
  EXPECT_EQ(tee_result_name(0x1234ABCD), "TEE_Result(0x1234abcd)");
  EXPECT_EQ(tee_result_name(1), "TEE_Result(0x00000001)");
  EXPECT_EQ(tee_origin_name(9), "origin(9)");
  EXPECT_EQ(command_name(24), "command(24)");
  EXPECT_EQ(name_of(digest_names, 99), "99");
  EXPECT_EQ(find_tag(0x70001234), nullptr);
}

TEST(Names, EveryWordLeadsBackToItsValue) {
  for (const name_table table : {algorithm_names, purpose_names, block_mode_names, padding_names, digest_names,
                                 origin_names, key_format_names, auth_type_names}) {
    for (const named_value& row : table) {
      EXPECT_EQ(value_of(table, row.name), row.value);
      EXPECT_EQ(name_of(table, row.value), row.name);
    }
  }
  EXPECT_FALSE(value_of(digest_names, "sha-3"));
}

TEST(Names, TagsAreNamedOnce) {
  std::set<std::string_view> names;
  std::set<keymaster_tag_t> tags;
  for (const tag_name& row : tag_names) {
    EXPECT_TRUE(names.insert(row.name).second) << row.name;
    EXPECT_TRUE(tags.insert(row.tag).second) << row.name;
    EXPECT_EQ(find_tag(row.tag), &row);
  }
}

TEST(Errors, SayTheStepAndBothLevelsByName) {
  const error refused({.kind = error_kind::keymaster,
                       .step = "begin",
                       .tee_result = 0,
                       .tee_origin = TEEC_ORIGIN_TRUSTED_APP,
                       .keymaster_error = KM_ERROR_INVALID_KEY_BLOB});
  EXPECT_STREQ(refused.what(), "begin failed: TEE_SUCCESS, KM_ERROR_INVALID_KEY_BLOB (-33)");
  const error failed({.kind = error_kind::tee,
                      .step = "begin",
                      .tee_result = 0xFFFF3071,
                      .tee_origin = TEEC_ORIGIN_TRUSTED_APP,
                      .keymaster_error = KM_ERROR_UNKNOWN_ERROR});
  EXPECT_STREQ(failed.what(), "begin failed: TEE_ERROR_MAC_INVALID from TRUSTED_APP, KM_ERROR_UNKNOWN_ERROR (-1000)");
  EXPECT_NE(failed.hint().find("altered"), std::string::npos);
  const error unreachable(
      {.kind = error_kind::connection, .step = "connect", .tee_result = 0xFFFF000D, .tee_origin = TEEC_ORIGIN_API});
  EXPECT_STREQ(unreachable.what(), "connect failed: TEE_ERROR_BUSY from API");
  EXPECT_NE(unreachable.hint().find("another process"), std::string::npos);
}

TEST(Errors, AdviceDependsOnTheStep) {
  const auto hint = [](const char* step, std::int32_t code) {
    return hint_for({.kind = error_kind::keymaster, .step = step, .keymaster_error = code});
  };
  EXPECT_NE(hint("begin", KM_ERROR_INVALID_ARGUMENT), hint("generate_key", KM_ERROR_INVALID_ARGUMENT));
  EXPECT_FALSE(hint("update", KM_ERROR_INVALID_ARGUMENT).empty());
  EXPECT_TRUE(hint("begin", -7777).empty());
}

}  // namespace
