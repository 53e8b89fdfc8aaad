// A server that is killed again and again while its clients work, and started again on what it left.
#include <cstdio>

#include "tests/kills/kill_fixture.h"

namespace hosted_tee::testing {
namespace {

using std::chrono::microseconds;

constexpr unsigned clients = 4;

/// What a server is started on beside a living one, and how it ends.
struct second_server {
  const char* state;
  const char* socket;
  int code;
  const char* reason;
};
constexpr std::array<second_server, 3> second_servers = {{
    {"state", "second.sock", teed_no_state, "is in use by another process"},
    {"state", "tee.sock", teed_no_state, "is in use by another process"},
    {"second", "tee.sock", teed_socket_taken, "another server answers"},
}};

class ServerKillTest : public KillTest {
 protected:
  ServerKillTest() : field(place(), clients) {}

  /// A moment to kill at, and how often of a hundred.
  struct moment {
    const char* name;
    unsigned share;
    void (ServerKillTest::*come)(const teed_process& server);
  };
  static const std::array<moment, 7> moments;

  void while_it_starts(const teed_process& /*server*/) { sleep_below(random, start_time); }
  void while_clients_come(const teed_process& server) {
    field.stage.wait_for_steps(client_step::open, 1 + static_cast<unsigned>(pick(random, clients)), server);
    sleep_below(random, microseconds(2000));
  }
  void while_keys_are_made(const teed_process& server) { in_the_middle_of(client_step::generate, server); }
  void while_keys_are_used(const teed_process& server) { in_the_middle_of(client_step::use, server); }
  void while_statements_are_made(const teed_process& server) { in_the_middle_of(client_step::statement, server); }
  void whenever(const teed_process& server) {
    field.stage.wait_for_steps(client_step::work, 1, server);
    sleep_below(random, microseconds(30000));
  }
  void while_clients_rest(const teed_process& server) {
    field.stage.wait_for_steps(client_step::work, 1, server);
    field.stage.rest(server);
  }
  void in_the_middle_of(client_step kind, const teed_process& server) {
    field.stage.wait_for_steps(kind, 1 + static_cast<unsigned>(pick(random, 20)), server);
    sleep_below(random, microseconds(4000));
  }

  [[nodiscard]] const moment& draw() {
    std::size_t chance = pick(random, 100);
    const moment* at = moments.data();
    for (; chance >= at->share; ++at) chance -= at->share;
    return *at;
  }

  void expect_a_second_server_refused() {
    const second_server& row = second_servers.at(pick(random, second_servers.size()));
    teed_process second({folder.path() / row.state, folder.path() / row.socket});
    const process_end end = second.wait();
    EXPECT_EQ(end.code, row.code) << end.said;
    EXPECT_NE(end.said.find(row.reason), std::string::npos) << end.said;
    EXPECT_FALSE(std::filesystem::exists(folder.path() / "second.sock"));
  }

  /// One life of the server, up to its death.
  void live_and_die() {
    const moment& when = draw();
    SCOPED_TRACE(when.name);
    field.stage.begin_life();
    teed_process server(field.place);
    if (pick(random, 16) == 0) {
      field.stage.wait_for_steps(client_step::work, 1, server);
      expect_a_second_server_refused();
    }
    (this->*when.come)(server);
    field.stage.doom();
    const process_end end = server.kill();
    EXPECT_EQ(end.signal, SIGKILL) << "it has ended by itself: " << end.said;
    field.stage.end_life();
    ++kills[when.name];
  }

  void measure_start() {
    const auto begin = std::chrono::steady_clock::now();
    teed_process server(field.place);
    ASSERT_NE(line_to(field, server), nullptr);
    start_time = std::chrono::duration_cast<microseconds>(std::chrono::steady_clock::now() - begin);
    EXPECT_EQ(server.kill().signal, SIGKILL);
  }

  void tell() const {
    const auto list = [](const char* what, const std::map<std::string, unsigned>& counts) {
      std::printf("%s:", what);
      for (const auto& [name, count] : counts) std::printf(" %s %u;", name.c_str(), count);
      std::printf("\n");
    };
    list("killed", kills);
    list("cut off", field.stage.cuts());
    std::printf("%zu keys, %zu statements\n", field.keys.size(), field.counter.told());
  }

  kill_field field;
  std::map<std::string, unsigned> kills;
  microseconds start_time{1};
};

const std::array<ServerKillTest::moment, 7> ServerKillTest::moments = {{
    {"while it starts", 10, &ServerKillTest::while_it_starts},
    {"while clients come", 15, &ServerKillTest::while_clients_come},
    {"while keys are made", 20, &ServerKillTest::while_keys_are_made},
    {"while keys are used", 10, &ServerKillTest::while_keys_are_used},
    {"while statements are made", 30, &ServerKillTest::while_statements_are_made},
    {"whenever", 10, &ServerKillTest::whenever},
    {"while clients rest", 5, &ServerKillTest::while_clients_rest},
}};

TEST_F(ServerKillTest, NoKeyIsLostNoCounterIsToldTwiceAndEveryClientIsToldWhatHappened) {
  provision(field);
  if (!HasFailure()) measure_start();
  {
    const client_crowd crowd(field, clients, random);
    for (unsigned round = 0; round < plan.rounds && !HasFailure(); ++round) {
      SCOPED_TRACE(::testing::Message() << "in round " << round);
      live_and_die();
    }
  }
  if (!HasFailure()) expect_whole(field);
  EXPECT_TRUE(plan.rounds < 20 || !field.stage.cuts().empty()) << "no kill has hit a command";
  tell();
}

}  // namespace
}  // namespace hosted_tee::testing
