// What a start that fails says, and what it answers to whoever opens the session.
#include <fmt/format.h>
#include <gmock/gmock.h>

#include "tests/support/device_fixture.h"

using hosted_tee::trace_level;

namespace testing_support {
namespace {

using trace_lines = std::vector<std::string>;

constexpr TEE_Result ksk_deleted = 0xF0100001;

struct start_failure {
  const char* call;
  std::uint32_t n;  // of the start's calls of that function
  trace_lines lines;
};

class StartTest : public DeviceTest {
 protected:
  void SetUp() override { tee.close_session(); }

  hosted_tee::fault_plan& faults() { return tee.world().faults(); }

  trace_lines lines(trace_level level = trace_level::error) {
    trace_lines found;
    for (const hosted_tee::trace_line& line : tee.world().trace().lines()) {
      if (line.level == level) found.push_back(line.text);
    }
    return found;
  }

  TEE_Result start() {
    TEE_Identity who = {};
    TEE_Param none[4] = {};
    std::uint32_t session = 0, origin = 0;
    tee.clear_trace();
    const TEE_Result result = tee.world().open_session(keymaster_ta, who, 0, none, session, origin);
    if (result == TEE_SUCCESS) tee.world().close_session(session);
    EXPECT_FALSE(tee.world().has_instance(keymaster_ta));
    faults().clear();
    return result;
  }

  void expect_failed_start(TEE_Result result, const trace_lines& expected) {
    EXPECT_EQ(start(), result);
    EXPECT_EQ(lines(), expected);
  }
  void expect_rows(const std::vector<start_failure>& rows, const std::function<void()>& approach) {
    for (const start_failure& row : rows) {
      SCOPED_TRACE(fmt::format("{} number {}", row.call, row.n));
      approach();
      faults().fail_call(row.call, row.n, TEE_ERROR_ACCESS_DENIED);
      expect_failed_start(TEE_ERROR_ACCESS_DENIED, row.lines);
    }
  }

  std::optional<std::string> stored() {
    return tee.world().read_object(keymaster_ta, TEE_STORAGE_RPMB, stored_ksk_name);
  }
  void store(std::string_view value) {
    tee.world().write_object(keymaster_ta, TEE_STORAGE_RPMB, stored_ksk_name, value);
  }
  void remove_key() { tee.world().delete_object(keymaster_ta, TEE_STORAGE_RPMB, stored_ksk_name); }

  const std::string code = " failed with 0xffff0001";
  const std::string derived = "Init derived KSK" + code, rpmb = "Init RPMB KSK" + code;
  static constexpr const char* store_failed = "Init key store failed";
};

TEST_F(StartTest, EachPlatformFailureHasItsLinesAndItsResult) {
  expect_rows(
      {
          {"TEE_GetPropertyAsUUID", 1, {"GetPropertyAsUUID" + code + "\n", derived, store_failed}},
          {"TEE_AllocateTransientObject", 1, {"AllocateTransientObject" + code + "\n", derived, store_failed}},
          {"TEE_PopulateTransientObject", 1, {"PopulateTransientObject" + code + "\n", derived, store_failed}},
          {"TEE_OpenPersistentObject", 1, {"Open KSK" + code + "\n", rpmb, store_failed}},
          {"TEE_ReadObjectData", 1, {"ReadObjectData" + code + "\n", rpmb, store_failed}},
          {"TEE_ReadObjectData", 2, {"ReadObjectData" + code + "\n", rpmb, store_failed}},
          {"TEE_AllocateTransientObject", 2, {"AllocateTransientObject" + code + "\n", rpmb, store_failed}},
          {"TEE_PopulateTransientObject", 2, {"PopulateTransientObject" + code + "\n", rpmb, store_failed}},
          {"TEE_AllocateTransientObject", 3, {"AllocateTransientObject" + code + "\n", "Init authorization failed"}},
          {"GetBootSeed", 1, {"GetBootSeed" + code + "\n", "Init authorization failed"}},
          {"TEE_PopulateTransientObject", 3, {"PopulateTransientObject" + code + "\n", "Init authorization failed"}},
      },
      [] {});
}

TEST_F(StartTest, EachPlatformFailureOfTheFirstStartHasItsLinesAndStoresNothing) {
  expect_rows(
      {
          {"TEE_AllocateTransientObject", 2, {"AllocateTransientObject" + code + "\n", rpmb, store_failed}},
          {"TEE_GenerateKey", 1, {"GenerateKey" + code + "\n", rpmb, store_failed}},
          {"TEE_GetObjectBufferAttribute", 1, {"GetObjectBufferAttribute" + code + "\n", rpmb, store_failed}},
          {"TEE_CreatePersistentObject", 1, {"CreatePersistentObject" + code + "\n", rpmb, store_failed}},
      },
      [this] { remove_key(); });
  EXPECT_FALSE(stored().has_value());
}

TEST_F(StartTest, WantOfMemoryForTheTablesFailsTheStart) {
  for (const std::uint32_t n : {1U, 2U}) {
    faults().fail_allocation(n);
    expect_failed_start(TEE_ERROR_OUT_OF_MEMORY, {"Out of memory", "Init authorization failed"});
  }
}

TEST_F(StartTest, WithoutTheRpmbTheStartGoesOn) {
  faults().fail_call("TEE_RPMB_MakeFileSystem", 1, TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(start(), TEE_SUCCESS);
  EXPECT_EQ(lines(), (trace_lines{"TEE_RPMB_MakeFileSystem return 0xffff0001"}));
  EXPECT_THAT(lines(trace_level::info), testing::Contains("no RPMB for ksk\n"));
}

TEST_F(StartTest, AStoredKeyOfAnotherLengthIsDeletedAndTheNextStartMakesAFreshOne) {
  const std::string before = stored().value();
  struct stored_length {
    std::size_t size;
    const char* line;
  };
  for (const stored_length& each : {stored_length{0, "Wrong persistent data length, expected 32B, got 0B"},
                                    {31, "Wrong persistent data length, expected 32B, got 31B"},
                                    {33, "Wrong persistent data length, expected 32B, got 33B"},
                                    {40, "Wrong persistent data length, expected 32B, got 33B"}}) {
    store(std::string(each.size, 'k'));
    expect_failed_start(ksk_deleted,
                        {each.line, "Now, delete the key and recreate it, but all previous keymaster key will die",
                         "Init RPMB KSK failed with 0xf0100001", store_failed});
    EXPECT_FALSE(stored().has_value());
    EXPECT_EQ(start(), TEE_SUCCESS);
    EXPECT_EQ(stored().value().size(), 32U);
    EXPECT_NE(stored().value(), before);
  }
}

TEST_F(StartTest, AMalformedKeyThatCantBeOpenedForDeletionStays) {
  store("short");
  faults().fail_call("TEE_OpenPersistentObject", 2, TEE_ERROR_ACCESS_DENIED);
  expect_failed_start(TEE_ERROR_ACCESS_DENIED,
                      {"Wrong persistent data length, expected 32B, got 5B",
                       "Now, delete the key and recreate it, but all previous keymaster key will die",
                       "OpenPersistentObject" + code + "\n", rpmb, store_failed});
  EXPECT_EQ(stored().value(), "short");
}

TEST_F(StartTest, TheResultOfTheDeletionIsIgnored) {
  store("short");
  faults().fail_call("TEE_CloseAndDeletePersistentObject1", 1, TEE_ERROR_ACCESS_DENIED);
  EXPECT_EQ(start(), ksk_deleted);
}

/// Answers of the platform that are successes and yet can't be true.
class FalseStartTest : public StartTest {
 protected:
  void claim(const char* call, std::uint32_t n, std::uint32_t claimed) {
    faults().override_output(call, n, [claimed](std::uint32_t* length, TEE_Result&) { *length = claimed; });
  }
};

TEST_F(FalseStartTest, AFreshKeyOfAnotherLengthFailsTheStartAndIsNotStored) {
  for (const std::uint32_t claimed : {0U, 31U, 33U, 0xFFFFFFFFU}) {
    remove_key();
    claim("TEE_GetObjectBufferAttribute", 1, claimed);
    expect_failed_start(TEE_ERROR_GENERIC,
                        {fmt::format("Wrong key size, expected 32B, got {}B", static_cast<std::int32_t>(claimed)),
                         "Init RPMB KSK failed with 0xffff0000", store_failed});
    EXPECT_FALSE(stored().has_value());
  }
}

TEST_F(FalseStartTest, AReadOfAnotherLengthCostsTheStoredKeyItsLife) {
  for (const std::uint32_t claimed : {0U, 31U, 40U}) {
    EXPECT_EQ(start(), TEE_SUCCESS);
    claim("TEE_ReadObjectData", 1, claimed);
    EXPECT_EQ(start(), ksk_deleted);
    EXPECT_EQ(lines().front(), fmt::format("Wrong persistent data length, expected 32B, got {}B", claimed));
    EXPECT_FALSE(stored().has_value());
  }
}

TEST_F(FalseStartTest, AByteBehindTheThirtySecondMakesTheStoredKeyMalformed) {
  claim("TEE_ReadObjectData", 2, 1);
  EXPECT_EQ(start(), ksk_deleted);
  EXPECT_EQ(lines().front(), "Wrong persistent data length, expected 32B, got 33B");
}

}  // namespace
}  // namespace testing_support
