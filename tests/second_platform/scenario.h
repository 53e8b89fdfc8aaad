// One of each command, as a list: what comes before, and the command itself.
#ifndef TESTS_SECOND_PLATFORM_SCENARIO_H_
#define TESTS_SECOND_PLATFORM_SCENARIO_H_

#include <functional>
#include <string>
#include <vector>

#include "tests/second_platform/ta_fixture.h"

namespace second_platform {

struct scenario {
  std::string name;
  /// Makes what the command needs, on a TA that has started; answers a blob.
  std::function<bytes(ta&)> prepare;
  /// Begins the operation of the blob, if the command is a step of one; answers its handle.
  std::function<std::uint32_t(ta&, const bytes& blob)> begin;
  std::function<command_answer(ta&, const bytes& blob, std::uint32_t handle)> command;
};

/// scenarios lists them; each succeeds on a platform that keeps to its word.
const std::vector<scenario>& scenarios();

}  // namespace second_platform

#endif  // TESTS_SECOND_PLATFORM_SCENARIO_H_
