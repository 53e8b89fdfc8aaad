// Two servers that are started at once, as a person and a service manager may do it.
#include <gtest/gtest.h>

#include <array>
#include <csignal>
#include <memory>
#include <thread>

#include "tee/client/management.h"
#include "tests/kills/kill_place.h"

namespace hosted_tee::testing {
namespace {

constexpr int rounds = 60;

class StartRaceTest : public ::testing::Test {
 protected:
  [[nodiscard]] server_place place(const char* state) const {
    return {folder.path() / state, folder.path() / "tee.sock"};
  }

  /// Starts both and waits until one has ended; answers that one as the first.
  using pair = std::array<std::unique_ptr<teed_process>, 2>;
  [[nodiscard]] static pair start_both(const server_place& one, const server_place& other) {
    pair both = {std::make_unique<teed_process>(one), std::make_unique<teed_process>(other)};
    const auto limit = std::chrono::steady_clock::now() + ample_time;
    while (!both[0]->has_ended() && !both[1]->ends_within(std::chrono::milliseconds(5))) {
      if (std::chrono::steady_clock::now() > limit) break;
    }
    if (!both[0]->has_ended()) std::swap(both[0], both[1]);
    return both;
  }

  /// serving_process asks who serves the socket.
  [[nodiscard]] std::uint32_t serving_process(const teed_process& expected) const {
    server_status now;
    const auto limit = std::chrono::steady_clock::now() + ample_time;
    while (!expected.has_ended() && std::chrono::steady_clock::now() < limit) {
      server_management asked;
      if (asked.connect("unix:" + (folder.path() / "tee.sock").string()).result == TEEC_SUCCESS) {
        EXPECT_EQ(asked.status(now).result, TEEC_SUCCESS);
        return now.pid;
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return 0;
  }

  /// Runs the race again and again, on a free path and on one that a killed server left.
  void race(const server_place& one, const server_place& other, int code, const char* reason) const {
    for (int round = 0; round < rounds && !HasFailure(); ++round) {
      SCOPED_TRACE(::testing::Message() << "in round " << round);
      const pair both = start_both(one, other);
      const process_end loser = both[0]->wait();
      EXPECT_EQ(loser.code, code) << loser.said;
      EXPECT_NE(loser.said.find(reason), std::string::npos) << loser.said;
      EXPECT_EQ(serving_process(*both[1]), static_cast<std::uint32_t>(both[1]->pid()));
      if (round % 2 == 0) {
        EXPECT_EQ(both[1]->kill().signal, SIGKILL);
      } else {
        EXPECT_EQ(both[1]->terminate().code, teed_done);
      }
      EXPECT_EQ(std::filesystem::exists(one.socket), round % 2 == 0);
    }
  }

  const kill_folder folder;
};

TEST_F(StartRaceTest, OfTwoServersOnOneFolderAndSocketOneServesAndTheOtherTellsThatTheFolderIsInUse) {
  race(place("state"), place("state"), teed_no_state, "is in use by another process");
}

TEST_F(StartRaceTest, OfTwoServersOnOneSocketOneServesAndTheOtherTellsThatTheSocketIsTaken) {
  race(place("one"), place("other"), teed_socket_taken, "another server answers");
}

}  // namespace
}  // namespace hosted_tee::testing
