// A server in the test's own process, on the test's device with its scripted TAs.
#ifndef TESTS_REMOTE_SERVER_FIXTURE_H_
#define TESTS_REMOTE_SERVER_FIXTURE_H_

#include <memory>
#include <string>
#include <thread>

#include "tee/client/management.h"
#include "tee/server/listener.h"
#include "tee/server/server.h"
#include "tests/remote/raw_client.h"
#include "tests/support/eventually.h"
#include "tests/tee/world_fixture.h"

namespace hosted_tee::testing {

/// Runs a server until the end of the scope.
class running_server {
 public:
  running_server(const std::string& path, std::shared_ptr<secure_world> world, const server_limits& limits = {},
                 mode_t mode = 0600);
  running_server(const running_server&) = delete;
  running_server& operator=(const running_server&) = delete;
  ~running_server();

  /// stop asks for the end without waiting; join waits for it.
  void stop() { server_.stop(); }
  void join();

 private:
  listening_socket file_;
  server server_;
  std::thread thread_;
};

using ::testing_support::eventually;

/// What this process has open and mapped of what servers and clients make.
struct belongings {
  std::size_t descriptors = 0;
  std::size_t shared_maps = 0;

  friend bool operator==(const belongings&, const belongings&) = default;
};
belongings current_belongings();

class ServerTest : public WorldTest {
 protected:
  ServerTest() { first_ta::apply(), second_ta::apply(); }

  [[nodiscard]] std::string path() const { return (folder.path() / "tee.sock").string(); }
  [[nodiscard]] std::string name() const { return "unix:" + path(); }

  /// serve starts the server (again), with limits.
  void serve(const server_limits& limits = {}, mode_t mode = 0600) {
    server.reset();
    server = std::make_unique<running_server>(path(), world, limits, mode);
  }

  /// A client that has said hello.
  [[nodiscard]] std::unique_ptr<raw_client> greeted() const {
    auto client = std::make_unique<raw_client>(path());
    client->greet();
    return client;
  }

  /// expect_served asserts that a well-behaved client gets what it asks for.
  void expect_served() const;

  /// has_let_go waits until the server has nothing of any client any more: sessions, instances, memory, connections.
  [[nodiscard]] bool has_let_go() const;

  [[nodiscard]] server_status status() const;

  std::unique_ptr<running_server> server;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_REMOTE_SERVER_FIXTURE_H_
