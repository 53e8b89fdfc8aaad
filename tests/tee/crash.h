// A process that dies at a chosen step, and what the next one finds.
#ifndef TESTS_TEE_CRASH_H_
#define TESTS_TEE_CRASH_H_

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <string_view>

namespace hosted_tee::testing {

using step_action = std::function<void(std::string_view)>;

/// dies_at runs `body` in a child process that ends, as if killed, at the `step`-th step that `body` reports (0 = the
/// first). False: `body` came to its end before.
inline bool dies_at(int step, const std::function<void(const step_action&)>& body) {
  const pid_t child = ::fork();
  if (child == 0) {
    int left = step;
    body([&left](std::string_view) {
      if (left-- == 0) ::_exit(1);
    });
    ::_exit(0);
  }
  int status = 0;
  EXPECT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFEXITED(status)) << "the child died of a signal";
  return WIFEXITED(status) && WEXITSTATUS(status) == 1;
}

}  // namespace hosted_tee::testing

#endif  // TESTS_TEE_CRASH_H_
