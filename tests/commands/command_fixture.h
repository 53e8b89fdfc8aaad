// What the tests of commands say again and again.
#ifndef TESTS_COMMANDS_COMMAND_FIXTURE_H_
#define TESTS_COMMANDS_COMMAND_FIXTURE_H_

#include <gmock/gmock.h>

#include <string>
#include <vector>

#include "src/params/keymaster_defs.h"
#include "tests/support/device_fixture.h"
#include "tests/support/rsa_test_key.h"

namespace testing_support {

using trace_lines = std::vector<std::string>;

/// All that a failure shows: both levels of error, and the error lines from first to last.
struct failure {
  TEEC_Result result;
  std::int32_t error;
  trace_lines lines;
};

/// refused is a failure that the Keymaster error tells; broken one that the TEE result tells.
failure refused(std::int32_t error, trace_lines lines);
failure broken(TEEC_Result result, trace_lines lines);

class CommandTest : public DeviceTest {
 protected:
  /// lines answers what was traced at a level since the trace was last cleared.
  trace_lines lines(hosted_tee::trace_level level = hosted_tee::trace_level::error);

  /// expect_failure runs `command` and expects it to fail just so: no response, and nothing left behind or lost.
  template <class Command>
  answer expect_failure(const failure& expected, Command&& command) {
    const hosted_tee::accounting before = tee.accounting();
    const answer got = expect_only_failure(expected, std::forward<Command>(command));
    expect_same(before);
    return got;
  }

  /// expect_lost runs an update or finish that fails just so and takes the operation `handle` with it: what the TA
  /// holds afterwards is what it held before the operation's begin.
  template <class Command>
  answer expect_lost(const failure& expected, std::uint32_t handle, const hosted_tee::accounting& before_begin,
                     Command&& command) {
    const answer got = expect_only_failure(expected, std::forward<Command>(command));
    expect_same(before_begin);
    EXPECT_EQ(client().abort(handle).error, keymaster::KM_ERROR_INVALID_OPERATION_HANDLE);
    return got;
  }

  /// succeeds runs a command that must work without an error line.
  template <class Command>
  auto succeeds(Command&& command) {
    tee.clear_trace();
    auto got = command();
    EXPECT_EQ(got.result, TEEC_SUCCESS);
    EXPECT_EQ(got.error, keymaster::KM_ERROR_OK);
    EXPECT_THAT(lines(), ::testing::IsEmpty());
    return got;
  }

  /// import_fixed imports the fixed key of a size; without `params` as a key for every kind of signature.
  bytes import_fixed(unsigned bits);
  bytes import_fixed(unsigned bits, const param_list& params);

  /// stored_ksk reads the value of the RPMB key storage key out of the device.
  bytes stored_ksk();

 private:
  template <class Command>
  answer expect_only_failure(const failure& expected, Command&& command) {
    tee.clear_trace();
    const answer got = command();
    EXPECT_EQ(got.result, expected.result);
    EXPECT_EQ(got.error, expected.error);
    EXPECT_EQ(lines(), expected.lines);
    EXPECT_EQ(got.size, 0U);
    return got;
  }
};

}  // namespace testing_support

#endif  // TESTS_COMMANDS_COMMAND_FIXTURE_H_
