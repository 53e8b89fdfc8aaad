// A server with provisioned device and shelf, and what it has when nobody is there.
#ifndef TESTS_LOAD_LOAD_FIXTURE_H_
#define TESTS_LOAD_LOAD_FIXTURE_H_

#include <gtest/gtest.h>

#include "tests/load/watched_teed.h"
#include "tests/load/worker.h"

namespace load {

// Clients' buffers and stacks are there at both looks, and commands leave nothing. What the bound leaves room for is
// how the allocator divides its arenas among threads that come and go. Between the looks at a minute's run there are
// 300,000 commands and more: a leak of the least that the allocator gives (32 bytes) in each would be more than twice
// the bound.
constexpr std::size_t allowed_growth = 4 << 20;

class LoadTest : public ::testing::Test {
 protected:
  LoadTest();
  ~LoadTest() override;

  watched_teed teed;
  key_shelf keys;

  /// Some hundred steps of one client, so that whatever is made once is made.
  void warm_up();

  /// What the server has when nobody is there, as soon as it is so.
  [[nodiscard]] holdings at_rest();

  /// What a new instance of the TA has, which is that of a client's first session. There must not be another one.
  [[nodiscard]] hosted_tee::ta_status fresh_instance();

  /// expect_as_before waits until the server has what it had at rest, and compares a fresh instance as well.
  void expect_as_before(const holdings& rest, const hosted_tee::ta_status& fresh);

  void expect_good_end() { EXPECT_EQ(teed.stop().code, testing_support::teed_done); }
};

void expect_same(const hosted_tee::ta_status& now, const hosted_tee::ta_status& before);

}  // namespace load

#endif  // TESTS_LOAD_LOAD_FIXTURE_H_
