// Want of memory, one allocation after the other: what a command answers when its n-th allocation fails.
#ifndef TESTS_COMMANDS_WANT_OF_MEMORY_H_
#define TESTS_COMMANDS_WANT_OF_MEMORY_H_

#include "tests/commands/command_fixture.h"

namespace testing_support {

/// What an allocation is for, and the failure when there is no memory for it.
struct allocation {
  const char* purpose;
  failure expected;
};

/// A command's allocations, all of them and in their order.
using allocations = std::vector<allocation>;

class WantOfMemoryTest : public CommandTest {
 protected:
  hosted_tee::fault_plan& faults() { return tee.world().faults(); }

  /// expect_rows fails the allocations of `command` each in its turn, and expects that it makes no others. A failure
  /// leaves the response buffer full of `on_failure`.
  template <class Command>
  void expect_rows(const allocations& rows, std::uint8_t on_failure, Command&& command) {
    for (std::uint32_t n = 1; n <= rows.size(); ++n) {
      SCOPED_TRACE(rows[n - 1].purpose);
      faults().clear();
      faults().fail_allocation(n);
      const answer got = expect_failure(rows[n - 1].expected, command);
      EXPECT_TRUE(faults().triggered());
      EXPECT_EQ(got.b, 0U);
      EXPECT_EQ(got.output, bytes(got.output.size(), on_failure));
    }
    faults().clear();
    (void)succeeds(command);
    EXPECT_EQ(faults().allocations(), rows.size());
  }

  const bytes app_id = pattern(20, 9);  // for a blob in parameters and characteristics
  static constexpr const char* no_memory = "Out of memory";
  static constexpr const char* no_memory_for_the_id = "Out of memory, require 20B";
};

}  // namespace testing_support

#endif  // TESTS_COMMANDS_WANT_OF_MEMORY_H_
