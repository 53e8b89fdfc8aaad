// Clients that end, in whatever way and whenever: nothing of theirs is left. And a server that ends.
#include <sys/mman.h>
#include <sys/socket.h>

#include "tee/runtime/uuid.h"
#include "tee/socket/packet_socket.h"
#include "tests/remote/held_command.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

using remote::frame_kind;

class ClientEndTest : public ServerTest {
 protected:
  ClientEndTest() { serve(); }

  static void share_a_page(raw_client& client) {
    const shared_file file = make_shared_file(4096);
    const auto answer =
        client.ask<remote::share_answer>(frame_kind::share_memory, remote::share_request{4096, 3}, {file.file.get()});
    ASSERT_EQ(answer.done.result, TEEC_SUCCESS);
  }
};

TEST_F(ClientEndTest, SessionsAndMemoryEndWithTheClient) {
  const belongings before = current_belongings();
  int closed = 0;
  first.close = [&](void*) { ++closed; };
  {
    const auto client = greeted();
    for (int i = 0; i < 3; ++i) (void)client->must_open(first_ta::uuid);
    share_a_page(*client);
    const server_status now = status();
    EXPECT_EQ(now.sessions, 3U);
    EXPECT_EQ(now.shared_bytes, 4096U);
    ASSERT_EQ(now.tas.size(), 1U);
    EXPECT_EQ(now.tas[0].sessions, 3U);
  }
  EXPECT_TRUE(has_let_go());
  EXPECT_EQ(closed, 3);
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
  EXPECT_TRUE(eventually([&] { return current_belongings() == before; }));
}

TEST_F(ClientEndTest, AClientThatBreaksTheRulesLosesItsSessionsToo) {
  const auto client = greeted();
  (void)client->must_open(first_ta::uuid);
  share_a_page(*client);
  EXPECT_EQ(client->refusal_after(raw_frame(std::uint16_t{99})), remote::refusal::malformed);
  EXPECT_TRUE(has_let_go());
  EXPECT_EQ(status().dropped, 1U);
}

TEST_F(ClientEndTest, SessionsOfOneClientAreNotTouchedByAnothersEnd) {
  const auto stays = greeted();
  const std::uint32_t session = stays->must_open(first_ta::uuid);
  int created = 0;
  first.create = [&] { return ++created, TEE_SUCCESS; };
  expect_served();
  EXPECT_EQ(stays->invoke(session).done.result, TEEC_SUCCESS);
  EXPECT_EQ(created, 0);  // it is the one instance that there already was
}

TEST_F(ClientEndTest, ACommandOfADeadClientIsFinishedAndForgotten) {
  held_command command(first);
  {
    const auto client = greeted();
    const std::uint32_t session = client->must_open(first_ta::uuid);
    client->send(raw_frame(frame_kind::invoke, body_of(remote::invoke_request{session, 5, {}})));
    command.wait_until_it_runs();
  }
  command.let_go();
  EXPECT_TRUE(has_let_go());
}

TEST_F(ClientEndTest, APanicIsItsSessionsEndAndNotTheServers) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) -> TEE_Result { TEE_Panic(3); };
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  for (int i = 0; i < 2; ++i) {
    const remote::outcome done = client->invoke(session).done;
    EXPECT_EQ(done.result, TEEC_ERROR_TARGET_DEAD);
    EXPECT_EQ(done.origin, TEEC_ORIGIN_TEE);
  }
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_SUCCESS; };
  expect_served();
}

TEST_F(ClientEndTest, AServerThatIsToldToEndFinishesTheCommandThatRuns) {
  held_command command(first);
  int closed = 0;
  first.close = [&](void*) { ++closed; };
  const auto client = greeted(), idle = greeted();
  (void)idle->must_open(first_ta::uuid);
  const std::uint32_t session = client->must_open(first_ta::uuid);
  client->send(raw_frame(frame_kind::invoke, body_of(remote::invoke_request{session, 5, {}})));
  command.wait_until_it_runs();
  server->stop();
  command.let_go();
  const raw_answer answer = client->receive();
  remote::invoke_answer told;
  ASSERT_TRUE(remote::read_body(answer.body, told));
  EXPECT_EQ(told.done.result, TEEC_SUCCESS);
  EXPECT_TRUE(client->is_closed());
  EXPECT_TRUE(idle->is_closed());
  server->join();
  EXPECT_EQ(closed, 2);
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
}

TEST_F(ClientEndTest, AServerThatIsToldToEndBeginsNoCommandThatWaits) {
  held_command command(first);
  int opened = 0, begun = 0;
  second.open = [&](auto&&...) { return ++opened, TEE_SUCCESS; };
  second.invoke = [&](auto&&...) { return ++begun, TEE_SUCCESS; };
  const auto client = greeted(), idle = greeted(), newcomer = greeted();
  const std::uint32_t other_session = idle->must_open(second_ta::uuid);
  client->send(
      raw_frame(frame_kind::invoke, body_of(remote::invoke_request{client->must_open(first_ta::uuid), 5, {}})));
  command.wait_until_it_runs();
  idle->send(raw_frame(frame_kind::invoke, body_of(remote::invoke_request{other_session, 5, {}})));
  newcomer->send(
      raw_frame(frame_kind::open_session, body_of(remote::open_request{to_bytes(second_ta::uuid), 0, 0, {}})));
  std::this_thread::sleep_for(std::chrono::milliseconds(50));  // they wait by now, most probably
  server->stop();
  command.let_go();
  EXPECT_EQ(client->receive().kind, remote::answer_to(frame_kind::invoke));
  const auto is_told_so = [](const raw_answer& answer, auto told) {
    return !answer.kind || (remote::read_body(answer.body, told) && told.done.result == TEEC_ERROR_COMMUNICATION &&
                            told.done.origin == TEEC_ORIGIN_COMMS);
  };
  EXPECT_TRUE(is_told_so(idle->receive(), remote::invoke_answer{}));
  EXPECT_TRUE(is_told_so(newcomer->receive(), remote::open_answer{}));
  server->join();
  EXPECT_EQ(opened, 1);
  EXPECT_EQ(begun, 0);
}

TEST_F(ClientEndTest, TheServersSocketFileGoesWithItUnlessAnotherHasTakenItsPlace) {
  EXPECT_TRUE(std::filesystem::exists(path()));
  server.reset();
  EXPECT_FALSE(std::filesystem::exists(path()));
  serve();
  std::filesystem::remove(path());
  EXPECT_THROW(listening_socket(path(), 0600), socket_taken);  // it lives, and has the path
  const file_descriptor other(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
  const sockaddr_un address = socket_address(path());
  ASSERT_EQ(::bind(other.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  server.reset();
  EXPECT_TRUE(std::filesystem::exists(path()));
}

}  // namespace
}  // namespace hosted_tee::testing
