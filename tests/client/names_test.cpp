#include "client/lib/names.h"

#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

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
}

const std::string in_the_trace = hint_for({.kind = error_kind::keymaster, .step = "begin", .keymaster_error = -7777});

TEST(Errors, WhatNobodyKnowsIsLookedForInTheTrace) {
  EXPECT_NE(in_the_trace.find("KEYMASTER_TRACE=error"), std::string::npos);
  EXPECT_EQ(hint_for({.kind = error_kind::tee, .step = "begin", .tee_result = 0x12345678}), in_the_trace);
}

std::vector<std::string> all_steps() {
  std::vector<std::string> steps{"connect", "open_session"};
  for (std::uint32_t command = 0; command < 64; ++command) {
    if (const std::string name = command_name(command); !name.starts_with("command(")) {
      steps.push_back(name);
    }
  }
  return steps;
}

// A client meets a Keymaster error with any command.
TEST(Errors, EveryKeymasterErrorHasAHintOfItsOwn) {
  std::size_t found = 0;
  for (std::int32_t code = -1; code >= -1000; --code) {
    const std::string name = keymaster_error_name(code);
    for (const std::string& step : all_steps()) {
      if (name.starts_with("KM_ERROR(") || (code == KM_ERROR_UNKNOWN_ERROR && step != "finish")) {
        continue;  // an unknown error is one that only the trace can tell more about
      }
      const std::string hint = hint_for({.kind = error_kind::keymaster, .step = step, .keymaster_error = code});
      EXPECT_NE(hint, in_the_trace) << step << ": " << name;
      EXPECT_FALSE(hint.empty());
      ++found;
    }
  }
  EXPECT_GT(found, 400U);
}

// The results that the Client API, the hosted TEE and the TA are known to answer, and when.
TEST(Errors, EveryResultThatAClientMeetsHasAHintOfItsOwn) {
  struct row {
    const char* step;
    std::vector<std::uint32_t> results;
  };
  constexpr std::uint32_t storage_no_space = 0xFFFF3041;
  constexpr std::uint32_t mac_invalid = 0xFFFF3071;
  constexpr std::uint32_t ksk_deleted = 0xF0100001;
  constexpr std::uint32_t ksk_rpmb_gone = 0xF0100003;
  for (const auto& [step, results] : std::vector<row>{
           {"connect",
            {TEEC_ERROR_BUSY, TEEC_ERROR_BAD_STATE, TEEC_ERROR_SECURITY, TEEC_ERROR_BAD_FORMAT,
             TEEC_ERROR_BAD_PARAMETERS, TEEC_ERROR_GENERIC, TEEC_ERROR_OUT_OF_MEMORY}},
           {"open_session",
            {TEEC_ERROR_ITEM_NOT_FOUND, TEEC_ERROR_BAD_FORMAT, storage_no_space, TEEC_ERROR_OUT_OF_MEMORY, ksk_deleted,
             TEEC_ERROR_TARGET_DEAD, TEEC_ERROR_BUSY}},
           {"begin",
            {mac_invalid, ksk_rpmb_gone, TEEC_ERROR_TARGET_DEAD, TEEC_ERROR_OUT_OF_MEMORY, TEEC_ERROR_BUSY,
             TEEC_ERROR_NOT_SUPPORTED, TEEC_ERROR_BAD_PARAMETERS, TEEC_ERROR_SHORT_BUFFER}},
           {"generate_key",
            {TEEC_ERROR_BAD_PARAMETERS, TEEC_ERROR_NOT_SUPPORTED, TEEC_ERROR_OUT_OF_MEMORY, TEEC_ERROR_SHORT_BUFFER,
             storage_no_space, TEEC_ERROR_NOT_IMPLEMENTED}},
           {"finish", {TEEC_ERROR_BAD_PARAMETERS, TEEC_ERROR_OUT_OF_MEMORY, TEEC_ERROR_TARGET_DEAD}},
       }) {
    for (const std::uint32_t result : results) {
      const std::string hint = hint_for({.kind = error_kind::tee, .step = step, .tee_result = result});
      EXPECT_NE(hint, in_the_trace) << step << ": " << tee_result_name(result);
    }
  }
}

// What the other TAs are known to answer, and when.
TEST(Errors, EveryResultOfACompanionHasAHintOfItsOwn) {
  struct row {
    const char* step;
    error_kind kind;
    std::uint32_t result;
  };
  constexpr std::uint32_t overflow = 0xFFFF300F;
  for (const auto& [step, kind, result] : std::vector<row>{
           {"open_provisioning", error_kind::connection, TEEC_ERROR_ITEM_NOT_FOUND},
           {"open_fingerprint", error_kind::connection, TEEC_ERROR_ITEM_NOT_FOUND},
           {"open_authenticator", error_kind::connection, TEEC_ERROR_ITEM_NOT_FOUND},
           {"open_device_information", error_kind::connection, TEEC_ERROR_ITEM_NOT_FOUND},
           {"generate_attk", error_kind::companion, TEEC_ERROR_ACCESS_DENIED},
           {"put_key", error_kind::companion, TEEC_ERROR_ACCESS_DENIED},
           {"put_key", error_kind::companion, TEEC_ERROR_BAD_FORMAT},
           {"put_property", error_kind::companion, TEEC_ERROR_ACCESS_DENIED},
           {"lock_device", error_kind::companion, TEEC_ERROR_ACCESS_DENIED},
           {"enrol_finger", error_kind::companion, TEEC_ERROR_BAD_PARAMETERS},
           {"enrol_finger", error_kind::companion, overflow},
           {"touch_finger", error_kind::companion, TEEC_ERROR_ITEM_NOT_FOUND},
           {"remove_finger", error_kind::companion, TEEC_ERROR_ITEM_NOT_FOUND},
           {"enrol_password", error_kind::companion, TEEC_ERROR_ACCESS_DENIED},
           {"enrol_password", error_kind::companion, TEEC_ERROR_BAD_PARAMETERS},
           {"enrol_password", error_kind::companion, TEEC_ERROR_BUSY},
           {"verify_password", error_kind::companion, TEEC_ERROR_ACCESS_DENIED},
           {"verify_password", error_kind::companion, TEEC_ERROR_BUSY},
       }) {
    const std::string hint = hint_for({.kind = kind, .step = step, .tee_result = result});
    EXPECT_NE(hint, in_the_trace) << step << ": " << tee_result_name(result);
    EXPECT_NE(hint, hint_for({.kind = kind, .step = "begin", .tee_result = result})) << step;
  }
}

TEST(Errors, EveryStatusOfTheAttestationCommandsHasAHintOfItsOwn) {
  for (const auto& [step, status] : std::vector<std::pair<const char*, std::int32_t>>{
           {"soter_generate_attk_key_pair", KM_ERROR_UNKNOWN_ERROR},
           {"soter_verify_attk_key_pair", SOTER_STATUS_NO_ATTK},
           {"soter_verify_attk_key_pair", SOTER_STATUS_UNREADABLE_ATTK},
           {"soter_export_attk_public_key", SOTER_STATUS_NO_ATTK},
           {"soter_get_device_id", KM_ERROR_UNKNOWN_ERROR},
           {"soter_get_device_id", KM_ERROR_INSUFFICIENT_BUFFER_SPACE},
       }) {
    const std::string hint = hint_for({.kind = error_kind::soter, .step = step, .soter_status = status});
    EXPECT_NE(hint, in_the_trace) << step << " " << status;
    // The numbers overlap with the Keymaster errors, whose advice would be wrong.
    EXPECT_NE(hint, hint_for({.kind = error_kind::keymaster, .step = step, .keymaster_error = status}));
  }
  EXPECT_EQ(hint_for({.kind = error_kind::soter, .step = "soter_get_device_id", .soter_status = -7777}), in_the_trace);
}

TEST(Names, AStatusOfTheAttestationCommandsHasItsOwnNameOrThatOfTheKeymasterError) {
  EXPECT_EQ(soter_status_name(0), "SOTER_STATUS_OK");
  EXPECT_EQ(soter_status_name(-1), "SOTER_STATUS_NO_ATTK");
  EXPECT_EQ(soter_status_name(-2), "SOTER_STATUS_UNREADABLE_ATTK");
  EXPECT_EQ(soter_status_name(-29), "KM_ERROR_INSUFFICIENT_BUFFER_SPACE");
  EXPECT_EQ(soter_status_name(-7777), "KM_ERROR(-7777)");
  EXPECT_EQ(command_name(0xFF00), "soter_generate_attk_key_pair");
  EXPECT_EQ(command_name(0xFF03), "soter_get_device_id");
}

TEST(Errors, ADamagedStateOrImageIsToldByItsFile) {
  const auto hint = [](const char* step) {
    return hint_for({.kind = error_kind::connection, .step = step, .tee_result = TEEC_ERROR_BAD_FORMAT});
  };
  EXPECT_NE(hint("connect").find("settings"), std::string::npos);
  EXPECT_NE(hint("open_session").find(".ta"), std::string::npos);
}

}  // namespace
