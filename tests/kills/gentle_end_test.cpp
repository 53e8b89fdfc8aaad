// A server that is told to end while its clients work.
#include "tests/kills/kill_fixture.h"

namespace hosted_tee::testing {
namespace {

constexpr unsigned clients = 4;
constexpr unsigned rounds = 15;

class GentleEndTest : public KillTest {
 protected:
  GentleEndTest() : field(place(), clients) {}

  void live_and_end() {
    field.stage.begin_life();
    teed_process server(field.place);
    const auto idle = line_to(field, server);
    field.stage.wait_for_steps(client_step::statement, 1 + static_cast<unsigned>(pick(random, 4)), server);
    sleep_below(random, std::chrono::microseconds(5000));
    field.stage.doom();
    const process_end end = server.terminate();  // with the idle client still there
    EXPECT_EQ(end.code, teed_done) << end.said;
    EXPECT_FALSE(std::filesystem::exists(field.place.socket));
    EXPECT_FALSE(std::filesystem::exists(field.place.socket.string() + ".lock"));
    if (idle) expect_gone(*idle);
    field.stage.end_life();
  }

  kill_field field;
};

// That no value is missing shows that whatever the TA did was answered: a command that had begun was not cut off.
TEST_F(GentleEndTest, WhatRunsIsAnsweredAndWhatComesLaterIsToldThatTheServerIsGone) {
  provision(field);
  {
    const client_crowd crowd(field, clients, random);
    for (unsigned round = 0; round < rounds && !HasFailure(); ++round) {
      SCOPED_TRACE(::testing::Message() << "in round " << round);
      live_and_end();
    }
  }
  if (!HasFailure()) expect_whole(field);
  field.counter.expect_no_gaps();
  EXPECT_GT(field.counter.told(), 3U);  // provisioning and the last look have three
  EXPECT_FALSE(field.stage.cuts().empty());
}

}  // namespace
}  // namespace hosted_tee::testing
