// A device whose server is killed, its clients, and what must be whole in the end.
#ifndef TESTS_KILLS_KILL_FIXTURE_H_
#define TESTS_KILLS_KILL_FIXTURE_H_

#include <gtest/gtest.h>

#include <list>
#include <memory>

#include "tests/kills/kill_client.h"
#include "tests/kills/kill_plan.h"

namespace hosted_tee::testing {

/// Clients at work, until the end of the scope.
class client_crowd {
 public:
  client_crowd(kill_field& field, unsigned count, dice& random) : field_(field) {
    while (clients_.size() < count) clients_.emplace_back(field, static_cast<std::uint32_t>(random()));
  }
  client_crowd(const client_crowd&) = delete;
  client_crowd& operator=(const client_crowd&) = delete;
  ~client_crowd() { field_.stage.end_all(); }

 private:
  kill_field& field_;
  std::list<kill_client> clients_;
};

/// line_to opens a session as soon as the server serves. Null, and a failure of the test, when the server ends instead
/// or does not serve within ample_time.
[[nodiscard]] std::unique_ptr<tee_line> line_to(const kill_field& field, const teed_process& server);

/// provision gives a device its attestation key, the fixed one of 2048 bits, and all else, and locks it; and makes the
/// key for statements, the fixed one of 1024 bits.
void provision(kill_field& field);

/// expect_whole starts the server once more and asks everything of it: every key that a client ever got works, the RPMB
/// storage does and the factory's data is there, the counter goes on, and it ends well and leaves no file beside the
/// state. The databases are in order.
void expect_whole(kill_field& field);

class KillTest : public ::testing::Test {
 protected:
  KillTest() : random(plan.seed) {}
  ~KillTest() override;

  [[nodiscard]] server_place place(const char* state = "state") const {
    return {folder.path() / state, folder.path() / "tee.sock"};
  }

  const kill_plan& plan = kill_plan::from_environment();
  dice random;
  const kill_folder folder;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_KILLS_KILL_FIXTURE_H_
