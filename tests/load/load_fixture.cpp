#include "tests/load/load_fixture.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdio>

namespace load {

LoadTest::LoadTest() : keys(fill_shelf(teed.name())) {}

LoadTest::~LoadTest() {
  if (HasFailure()) fmt::print(stderr, "teed said:\n{}\n", teed.said());
}

void LoadTest::warm_up() {
  tally counts;
  std::size_t left = 500;
  work(teed.name(), {seed_of_run(), UINT32_MAX}, keys, counts, [&left] { return left-- > 0; });
}

holdings LoadTest::at_rest() {
  holdings now;
  EXPECT_TRUE(eventually([&] {
    now = teed.holdings_now();
    // A connection is not counted any more a moment before its thread and its descriptors go.
    return now.connections == 1 && now.instances == 0 && now.threads == SERVER_THREADS + 1;
  })) << ::testing::PrintToString(now);
  return now;
}

hosted_tee::ta_status LoadTest::fresh_instance() {
  EXPECT_TRUE(eventually([this] { return teed.status().tas.empty(); }));
  const testing_support::ta_client client(teed.name());
  const hosted_tee::server_status now = teed.status();
  if (now.tas.size() != 1) throw std::runtime_error("there are other instances than the one that was looked for");
  return now.tas.front();
}

void LoadTest::expect_as_before(const holdings& rest, const hosted_tee::ta_status& fresh) {
  holdings now;
  EXPECT_TRUE(eventually([&] {
    now = teed.holdings_now();
    return now.is_within(rest);
  })) << "left behind: "
      << ::testing::PrintToString(now) << "; before: " << ::testing::PrintToString(rest);
  expect_same(fresh_instance(), fresh);
}

void expect_same(const hosted_tee::ta_status& now, const hosted_tee::ta_status& before) {
  EXPECT_EQ(now.ta, before.ta);
  EXPECT_EQ(now.sessions, before.sessions);
  EXPECT_EQ(now.operations, before.operations);
  EXPECT_EQ(now.heap_bytes, before.heap_bytes);
  EXPECT_EQ(now.heap_peak, before.heap_peak);
  EXPECT_EQ(now.transient_objects, before.transient_objects);
  EXPECT_EQ(now.persistent_objects, before.persistent_objects);
}

}  // namespace load
