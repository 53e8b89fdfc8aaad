#include "tests/remote/server_fixture.h"

#include <fstream>

namespace hosted_tee::testing {

running_server::running_server(const std::string& path, std::shared_ptr<secure_world> world,
                               const server_limits& limits, mode_t mode)
    : file_(path, mode),
      server_({std::move(world), "the test's folder", file_.take(), limits, {}}),
      thread_([this] { server_.run(); }) {}

running_server::~running_server() {
  stop();
  join();
}

void running_server::join() {
  if (thread_.joinable()) thread_.join();
}

belongings current_belongings() {
  belongings now;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) ++now.descriptors;
  std::ifstream maps("/proc/self/maps");
  for (std::string line; std::getline(maps, line);) {
    if (line.find("/memfd:") != std::string::npos) ++now.shared_maps;
  }
  return now;
}

void ServerTest::expect_served() const {
  raw_client client(path());
  client.greet();
  const std::uint32_t session = client.must_open(first_ta::uuid);
  EXPECT_EQ(client.invoke(session).done.result, TEEC_SUCCESS);
  EXPECT_EQ(
      client.ask<remote::plain_answer>(remote::frame_kind::close_session, remote::close_request{session}).done.result,
      TEEC_SUCCESS);
}

server_status ServerTest::status() const {
  server_management management;
  server_status now;
  // Those that have just left may still take the last places.
  EXPECT_TRUE(eventually([&] { return management.connect(name()).result == TEEC_SUCCESS; }));
  EXPECT_EQ(management.status(now).result, TEEC_SUCCESS);
  return now;
}

bool ServerTest::has_let_go() const {
  return eventually([this] {
    const server_status now = status();
    return now.connections == 1 && now.sessions == 0 && now.tas.empty() && now.shared_blocks == 0 &&
           now.shared_bytes == 0;
  });
}

}  // namespace hosted_tee::testing
