// Clients that want more than there is.
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <future>

#include "tee/socket/packet_socket.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

using remote::refusal;

class HostileFloodTest : public ServerTest {
 protected:
  /// Connects until the server refuses, and gives those that it took.
  std::vector<std::unique_ptr<raw_client>> flood() {
    std::vector<std::unique_ptr<raw_client>> taken;
    for (int i = 0; i < 1000; ++i) {
      auto client = std::make_unique<raw_client>(path());
      client->send(raw_frame(remote::frame_kind::hello));
      const raw_answer answer = client->receive();
      if (answer.kind == remote::refused_kind) {
        remote::refusal_answer why;
        EXPECT_TRUE(remote::read_body(answer.body, why));
        EXPECT_EQ(why.reason, refusal::crowded);
        EXPECT_TRUE(client->is_closed());
        break;
      }
      taken.push_back(std::move(client));
    }
    return taken;
  }

  /// Connects, and closes at once what it got, until it is told to stop.
  void come_and_go(const std::atomic<bool>& over) {
    const sockaddr_un address = socket_address(path());
    while (!over) {
      const file_descriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
      (void)::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
    }
  }

  TEEC_Result initialize() {
    TEEC_Context context{};
    const TEEC_Result result = TEEC_InitializeContext(name().c_str(), &context);
    TEEC_FinalizeContext(&context);
    return result;
  }
};

TEST_F(HostileFloodTest, ConnectionsHaveALimitAndThoseWithinItAreServed) {
  server_limits limits;
  limits.connections = 20;
  serve(limits);
  const auto early = greeted();
  const std::uint32_t session = early->must_open(first_ta::uuid);
  auto crowd = flood();
  EXPECT_EQ(crowd.size(), 19U);
  EXPECT_EQ(initialize(), TEEC_ERROR_BUSY);
  EXPECT_EQ(early->invoke(session).done.result, TEEC_SUCCESS);
  crowd.clear();
  EXPECT_TRUE(eventually([&] { return initialize() == TEEC_SUCCESS; }));
  EXPECT_GE(status().refused, 2U);
}

TEST_F(HostileFloodTest, OneProcessAndOneUserDoNotTakeAllPlaces) {
  server_limits limits;
  limits.connections = 20;
  limits.connections_per_process = 5;
  serve(limits);
  EXPECT_EQ(flood().size(), 5U);
  limits.connections_per_process = 20;
  limits.connections_per_user = 7;
  serve(limits);
  EXPECT_EQ(flood().size(), 7U);
}

TEST_F(HostileFloodTest, ManyThatComeAndGoLeaveNothing) {
  serve();
  const belongings before = current_belongings();
  for (int i = 0; i < 500; ++i) {
    raw_client client(path());
    if (i % 2 == 0) client.send(raw_frame(remote::frame_kind::hello));
  }
  EXPECT_TRUE(has_let_go());
  EXPECT_TRUE(eventually([&] { return current_belongings() == before; }));
}

TEST_F(HostileFloodTest, WhoComesAndGoesAllTheWhileKeepsNeitherOthersOutNorTheServerFromEnding) {
  server_limits limits;
  limits.allow_connections(64);
  serve(limits);
  std::atomic<bool> over{false};
  std::vector<std::thread> flood;
  for (int i = 0; i < 6; ++i) flood.emplace_back([&] { come_and_go(over); });
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(eventually([&] { return initialize() == TEEC_SUCCESS; }));
  server->stop();
  const auto ended = std::async(std::launch::async, [&] { server->join(); });
  EXPECT_EQ(ended.wait_for(std::chrono::seconds(20)), std::future_status::ready);
  over = true;
  for (std::thread& one : flood) one.join();
}

TEST_F(HostileFloodTest, SomePlacesAreKeptForThoseWhoMayManage) {
  if (::geteuid() != 0) GTEST_SKIP() << "only root can be somebody else";
  server_limits limits;
  limits.connections = limits.connections_per_user = limits.connections_per_process = 8;
  limits.connections_kept = 2;
  serve(limits, 0666);
  std::filesystem::permissions(folder.path(), std::filesystem::perms(0755));
  std::vector<std::unique_ptr<raw_client>> strangers;
  std::thread([&] {
    constexpr long nobody = 65534;
    ASSERT_EQ(::syscall(SYS_setresuid, -1, nobody, -1), 0);  // of this thread alone
    strangers = flood();
    ASSERT_EQ(::syscall(SYS_setresuid, -1, 0, -1), 0);
  }).join();
  EXPECT_EQ(strangers.size(), 6U);
  EXPECT_EQ(status().connections, 7U);
  EXPECT_TRUE(eventually([&] { return strangers.size() + flood().size() == 8; }));
}

TEST_F(HostileFloodTest, SessionsOfAConnectionHaveALimit) {
  server_limits limits;
  limits.sessions = 3;
  serve(limits);
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  (void)client->must_open(first_ta::uuid);
  (void)client->must_open(first_ta::uuid);
  EXPECT_EQ(client->open_session(first_ta::uuid).done.result, TEEC_ERROR_BUSY);
  expect_served();
  (void)client->ask<remote::plain_answer>(remote::frame_kind::close_session, remote::close_request{session});
  EXPECT_EQ(client->open_session(first_ta::uuid).done.result, TEEC_SUCCESS);
}

}  // namespace
}  // namespace hosted_tee::testing
