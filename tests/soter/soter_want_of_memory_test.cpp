// What the log says of want of memory on the way to a statement: the text and the level.
#include <algorithm>

#include "soter/soter_init.h"
#include "tests/soter/statement_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;

using text_lines = std::vector<std::string>;

struct outcome {
  TEE_Result result;
  text_lines errors, debug;
};

class SoterWantOfMemoryTest : public SoterStatementTest {
 protected:
  void load() { ASSERT_EQ(soter_ensure_ready(), TEE_SUCCESS); }

  /// Runs `act` with each of its allocations failing, one at a time.
  template <class Act>
  std::vector<outcome> without_memory(Act&& act) {
    std::vector<outcome> seen;
    for (unsigned n = 1; n < 300; ++n) {
      just_before = [this, n] { faults().clear(), faults().fail_allocation(n); };
      ta().clear_trace();
      const TEE_Result result = act();
      const bool triggered = faults().triggered();
      faults().clear();
      if (!triggered) return seen;
      seen.push_back({result, errors(), ta().traced(trace_level::debug)});
    }
    ADD_FAILURE() << "no end of allocations";
    return seen;
  }

  /// expect_seen looks for an outcome with just these error lines, and this debug line if it is one.
  static void expect_seen(const std::vector<outcome>& seen, TEE_Result result, const text_lines& errors,
                          const std::string& debug = {}) {
    const bool found = std::any_of(seen.begin(), seen.end(), [&](const outcome& each) {
      return each.result == result && each.errors == errors &&
             (debug.empty() || std::find(each.debug.begin(), each.debug.end(), debug) != each.debug.end());
    });
    EXPECT_TRUE(found) << ::testing::PrintToString(errors) << debug;
  }

  const param_list by_attk =
      param_list{}.add(KM_TAG_SOTER_COUNTED).add(KM_TAG_SOTER_UID, 7).add(KM_TAG_SOTER_SIGNED_BY_ATTK);
};

TEST_F(SoterWantOfMemoryTest, WantOfMemoryWhileLoadingIsTold) {
  const std::vector<outcome> seen = without_memory([&] {
    just_before();
    const TEE_Result result = soter_ensure_ready();
    if (result == TEE_SUCCESS) soter_release_resources();
    return result;
  });
  for (const char* const line : {"No memory for serialization\n", "No memory for prop->buf, tag 0x1835 length 9\n",
                                 "No memory for prop->buf, tag 0x1836 length 4\n", "No memory for cpu_id",
                                 "No memory for tee_name", "No memory for tee_version"}) {
    expect_seen(seen, TEE_ERROR_OUT_OF_MEMORY, {}, line);
  }
  expect_seen(seen, TEE_ERROR_OUT_OF_MEMORY, {"No memory for buf"});
}

TEST_F(SoterWantOfMemoryTest, WantOfMemoryWhileExportingIsTold) {
  load();
  const std::vector<outcome> seen = without_memory([&] { return export_key(by_attk).result; });
  expect_seen(seen, TEE_ERROR_OUT_OF_MEMORY, {"json error root_value (nil) root_object (nil)\n"});
  expect_seen(seen, TEE_ERROR_BAD_STATE, {"set counter error -1\n"});
  expect_seen(seen, TEE_ERROR_BAD_STATE, {"set number error ffffffff\n"});
  expect_seen(seen, TEE_ERROR_BAD_STATE, {"set publickey error -1\n"});
  expect_seen(seen, TEE_ERROR_OUT_OF_MEMORY, {"export public key error\n"});
  expect_seen(seen, TEE_ERROR_BAD_STATE, {"json serialization error\n"});
}

TEST_F(SoterWantOfMemoryTest, WantOfMemoryWhileSigningIsTold) {
  load();
  touch(3);
  signing op;
  begin(op);
  const std::vector<outcome> seen = without_memory([&] { return sign(op, "x").result; });
  const std::string last = "produce json string error";
  expect_seen(seen, TEE_ERROR_OUT_OF_MEMORY, {"json error root_value (nil) root_object (nil)\n", last});
  for (const char* const line :
       {"set raw message error -1\n", "set finger id error -1\n", "set counter error -1\n", "set uid error -1\n",
        "set tee name error -1\n", "set tee version error -1\n", "set fp sensor name error -1\n",
        "set fp sensor version error -1\n", "set cpu id error -1\n", "json serialization error\n"}) {
    expect_seen(seen, TEE_ERROR_BAD_STATE, {line, last});
  }
  expect_seen(seen, TEE_ERROR_OUT_OF_MEMORY, {"Out of memory"});
  expect_seen(seen, TEE_ERROR_OUT_OF_MEMORY, {"Out of memory for output"});
}

}  // namespace
}  // namespace testing_support
