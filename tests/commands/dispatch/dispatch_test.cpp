// How commands are found and checked before any handler runs.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/commands/dispatch/command_rows.h"

namespace testing_support {
namespace {

using hosted_tee::trace_level;

constexpr std::uint32_t soter_generate = 0xFF00;
constexpr std::uint32_t soter_set_fid = 0xFF04;
constexpr std::uint32_t slot_size = 16;

/// The four slots of a call, each filled by its type with something that a handler would overwrite.
struct filled_slots {
  std::array<bytes, 4> buffers;
  TEE_Param params[4] = {};

  filled_slots(std::uint32_t types, std::uint32_t a, std::uint32_t b) {
    for (std::uint32_t i = 0; i < 4; ++i) {
      buffers.at(i) = pattern(slot_size, i);
      const std::uint32_t type = TEE_PARAM_TYPE_GET(types, i);
      if (type >= TEE_PARAM_TYPE_MEMREF_INPUT) {
        params[i] = memref(buffers.at(i));
      } else if (type != TEE_PARAM_TYPE_NONE) {
        params[i] = values(a, b);
      }
    }
  }

  void expect_untouched(std::uint32_t types, std::uint32_t a, std::uint32_t b) {
    for (std::uint32_t i = 0; i < 4; ++i) {
      EXPECT_EQ(buffers.at(i), pattern(slot_size, i));
      const std::uint32_t type = TEE_PARAM_TYPE_GET(types, i);
      if (type >= TEE_PARAM_TYPE_MEMREF_INPUT) {
        EXPECT_EQ(params[i].memref.buffer, buffers.at(i).data());
        EXPECT_EQ(params[i].memref.size, slot_size);
      } else if (type == TEE_PARAM_TYPE_VALUE_INPUT || type == TEE_PARAM_TYPE_VALUE_INOUT) {
        EXPECT_EQ(params[i].value.a, a);
        EXPECT_EQ(params[i].value.b, b);
      }
    }
  }
};

/// All parameter types that differ from `right` in one slot, and the layouts of the other commands.
std::vector<std::uint32_t> wrong_types(std::uint32_t right) {
  std::vector<std::uint32_t> wrong;
  for (std::uint32_t slot = 0; slot < 4; ++slot) {
    for (const std::uint32_t type : {0U, 1U, 2U, 3U, 5U, 6U, 7U}) {
      wrong.push_back((right & ~(0xFU << (4 * slot))) | (type << (4 * slot)));
    }
  }
  wrong.insert(wrong.end(), {values_only, with_request, with_response, with_both, status_and_response, request_only});
  std::erase(wrong, right);
  return wrong;
}

class DispatchTest : public CommandTest {
 protected:
  /// With no other TA on the device only the Keymaster TA's own lines are traced.
  DispatchTest() { tee.world().device().ta_folders.clear(); }

  raw_session session{tee.world()};

  /// Every call's first line.
  static std::string call_line(std::uint32_t id, std::uint32_t types) {
    return fmt::format("TA_InvokeCommandEntryPoint nCommandID 0x{:x} pSessionContext (nil) nParamTypes 0x{:x}\n", id,
                       types);
  }

  /// expect_refusal makes a call that the dispatcher must refuse with this error line, touching nothing.
  void expect_refusal(std::uint32_t id, std::uint32_t types, std::uint32_t a, std::uint32_t b,
                      const std::string& line) {
    filled_slots slots(types, a, b);
    const hosted_tee::accounting before = tee.accounting();
    tee.clear_trace();
    EXPECT_EQ(session.invoke(id, types, slots.params), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_THAT(lines(), testing::ElementsAre(line));
    slots.expect_untouched(types, a, b);
    expect_same(before);
  }
};

TEST_F(DispatchTest, EveryCommandIsTracedByItsNumberItsTypesAndItsName) {
  for (const command_row& row : command_rows) {
    SCOPED_TRACE(row.name);
    filled_slots slots(row.types, 0, 0);
    tee.clear_trace();
    (void)session.invoke(row.id, row.types, slots.params);
    std::vector<std::string> expected = {call_line(row.id, row.types), row.name};
    if (row.id == soter_generate) {  // the one handler with a line of its own at this level
      expected.emplace_back("this function should not be called in anytime but in meta mode\n");
    }
    EXPECT_EQ(lines(trace_level::info), expected);
    const auto& first = tee.world().trace().lines().front();
    EXPECT_EQ(first.text, call_line(row.id, row.types));
    EXPECT_EQ(first.prefix, "KEYMASTER");
    EXPECT_EQ(first.function, "TA_InvokeCommandEntryPoint");
    EXPECT_EQ(tee.world().trace().lines().at(1).text, row.name);
  }
}

TEST_F(DispatchTest, WithItsTypesAndAClearedSlotNoCommandIsRefusedByTheDispatcher) {
  for (const command_row& row : command_rows) {
    SCOPED_TRACE(row.name);
    filled_slots slots(row.types, 0, 0);
    tee.clear_trace();
    (void)session.invoke(row.id, row.types, slots.params);
    EXPECT_THAT(lines(), testing::Not(testing::Contains(testing::StartsWith("Bad argument"))));
    EXPECT_THAT(lines(), testing::Not(testing::Contains(testing::StartsWith("Unknown command"))));
  }
}

TEST_F(DispatchTest, AnUnknownCommandIsRefusedWithItsNumberInTheTraceAndWithoutAName) {
  for (const std::uint32_t id : {0U, 24U, 25U, 0xFEFFU, 0xFF05U, 0x10001U, 0xFFFFFFFFU}) {
    SCOPED_TRACE(id);
    expect_refusal(id, with_both, 1, 2, fmt::format("Unknown command {:x}\n", id));
    EXPECT_THAT(lines(trace_level::info), testing::ElementsAre(call_line(id, with_both)));
  }
  EXPECT_EQ(command_rows.size(), 28U);
}

TEST_F(DispatchTest, Command24IsPrintedInHexadecimal) {
  expect_refusal(24, values_only, 0, 0, "Unknown command 18\n");
}

TEST_F(DispatchTest, AnUnknownCommandIsRefusedWhateverItsTypes) {
  for (const std::uint32_t types : wrong_types(with_both)) {
    SCOPED_TRACE(types);
    expect_refusal(24, types, 0, 0, "Unknown command 18\n");
  }
}

TEST_F(DispatchTest, WrongTypesAreRefusedAfterTheNameWasTraced) {
  for (const command_row& row : command_rows) {
    if (row.id == soter_set_fid) continue;
    for (const std::uint32_t types : wrong_types(row.types)) {
      SCOPED_TRACE(fmt::format("{} with types {:#06x}", row.name, types));
      expect_refusal(row.id, types, 0, 0, "Bad argument type\n");
      EXPECT_THAT(lines(trace_level::info), testing::ElementsAre(call_line(row.id, types), row.name));
    }
  }
}

TEST_F(DispatchTest, OnlySetFidPrintsTheWrongTypes) {
  for (const std::uint32_t types : wrong_types(request_only)) {
    SCOPED_TRACE(types);
    expect_refusal(soter_set_fid, types, 0, 0, fmt::format("Bad argument type 0x{:x}\n", types));
    EXPECT_THAT(lines(trace_level::info), testing::ElementsAre(call_line(soter_set_fid, types), "soter_handle_setFid"));
  }
}

TEST_F(DispatchTest, TypesAreCheckedBeforeValues) {
  expect_refusal(13, values_only, 1, 1, "Bad argument type\n");
}

TEST_F(DispatchTest, WordsThatMustBeZeroAreCheckedOneByOne) {
  for (const command_row& row : command_rows) {
    if (TEE_PARAM_TYPE_GET(row.types, 0) != TEE_PARAM_TYPE_VALUE_INOUT) continue;
    for (const std::uint32_t word : {1U, 0x80000000U}) {
      SCOPED_TRACE(fmt::format("{} with {:#x}", row.name, word));
      if (row.a_is_zero) expect_refusal(row.id, row.types, word, 0, "Bad argument\n");
      if (row.b_is_zero) expect_refusal(row.id, row.types, 0, word, "Bad argument\n");
      if (row.b_is_zero) expect_refusal(row.id, row.types, word, word, "Bad argument\n");
    }
  }
}

TEST_F(DispatchTest, WordsThatAreInputsAreNotChecked) {
  for (const command_row& row : command_rows) {
    if (TEE_PARAM_TYPE_GET(row.types, 0) != TEE_PARAM_TYPE_VALUE_INOUT) continue;
    SCOPED_TRACE(row.name);
    filled_slots slots(row.types, row.a_is_zero ? 0 : 7, row.b_is_zero ? 0 : 9);
    tee.clear_trace();
    (void)session.invoke(row.id, row.types, slots.params);
    EXPECT_THAT(lines(), testing::Not(testing::Contains("Bad argument\n")));
  }
}

TEST_F(DispatchTest, ARefusedCallHasTheTrustedApplicationAsItsOrigin) {
  const answer a = client().call(24, 0, 0, std::nullopt, std::nullopt);
  EXPECT_EQ(a.result, TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(a.origin, TEEC_ORIGIN_TRUSTED_APP);
}

}  // namespace
}  // namespace testing_support
