// Clients that pass sockets whose last close waits for the network, so that whoever has that last one waits with it.
#include <linux/sockios.h>
#include <netinet/in.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include "tee/socket/packet_socket.h"
#include "tests/remote/held_command.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

using remote::frame_kind;

constexpr auto longer_than_any_test = std::chrono::minutes(5);

class LingeringTest : public ServerTest {
 protected:
  /// The connections end with the other side's socket; so the server must have ended before.
  ~LingeringTest() override { EXPECT_EQ(server, nullptr); }

  LingeringTest() : network_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    place_.sin_family = AF_INET;
    place_.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t length = sizeof place_;
    EXPECT_EQ(::bind(network_.get(), reinterpret_cast<sockaddr*>(&place_), length), 0);
    EXPECT_EQ(::listen(network_.get(), 100), 0);
    EXPECT_EQ(::getsockname(network_.get(), reinterpret_cast<sockaddr*>(&place_), &length), 0);
  }

  /// A connection with more sent than anybody will take.
  file_descriptor lingering() const {
    file_descriptor socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(::connect(socket.get(), reinterpret_cast<const sockaddr*>(&place_), sizeof place_), 0);
    const bytes block(65536);
    while (::send(socket.get(), block.data(), block.size(), MSG_DONTWAIT) > 0) {
    }
    const linger waits{1, static_cast<int>(std::chrono::seconds(longer_than_any_test).count())};
    EXPECT_EQ(::setsockopt(socket.get(), SOL_SOCKET, SO_LINGER, &waits, sizeof waits), 0);
    return socket;
  }

  /// A Unix socket in which one of those lies unread.
  file_descriptor lingering_within() const {
    std::array<int, 2> ends{-1, -1};
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()), 0);
    file_descriptor inner(ends[0]);
    const file_descriptor outer(ends[1]);
    EXPECT_EQ(send_packet(outer.get(), bytes{1}, lingering().get()), 0);
    return inner;
  }

  /// A client sends what it has to send while the server is busy with it, so that the server has the last descriptors.
  /// Those that leave at once leave it unread.
  void send_and_leave(bool at_once, const std::function<bool(raw_client&)>& send) {
    if (!server) serve();
    {
      held_command command(first);
      auto client = come_in();
      client->send(
          raw_frame(frame_kind::invoke, body_of(remote::invoke_request{client->must_open(first_ta::uuid), 5, {}})));
      command.wait_until_it_runs();
      EXPECT_TRUE(send(*client));
      if (at_once) client.reset();
      command.let_go();
      if (!at_once) {
        (void)client->receive();
        EXPECT_TRUE(eventually([&] { return is_read(*client); }));
      }
      (void)status();  // which waits for the command
    }
    first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_SUCCESS; };
  }

  /// Whether the server has taken all that the client sent.
  static bool is_read(const raw_client& client) {
    int waiting = 0;
    EXPECT_EQ(::ioctl(client.socket(), SIOCOUTQ, &waiting), 0);
    return waiting == 0;
  }

  /// Those that have just left may still take the last places.
  std::unique_ptr<raw_client> come_in() const {
    std::unique_ptr<raw_client> client;
    const bool is_in = eventually([&] {
      try {
        client = greeted();
        return true;
      } catch (const std::runtime_error&) {
        return false;
      }
    });
    if (!is_in) throw std::runtime_error("there is no place");
    return client;
  }

  static bytes share_frame() { return raw_frame(frame_kind::share_memory, body_of(remote::share_request{4096, 1})); }

 private:
  file_descriptor network_;
  sockaddr_in place_{};
};

TEST_F(LingeringTest, ASocketThatIsPassedHoldsNobodyUp) {
  send_and_leave(false, [&](raw_client& client) { return client.send(share_frame(), {lingering().get()}); });
  expect_served();
  server.reset();
}

TEST_F(LingeringTest, MoreSocketsThanAFrameMayBringHoldNobodyUp) {
  send_and_leave(false, [&](raw_client& client) {
    return client.send(share_frame(), {lingering().get(), lingering().get(), lingering().get()});
  });
  expect_served();
  server.reset();
}

// Else some clients that pass as many as can be passed, and have their closing wait, would leave the server none.
TEST_F(LingeringTest, DescriptorsThatNothingNeedsAreNotKeptMeanwhile) {
  serve();
  const file_descriptor other(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
  const std::size_t before = current_belongings().descriptors;
  send_and_leave(false, [&](raw_client& client) {
    const file_descriptor first_of_all = lingering_within();
    std::vector<int> all(253, other.get());
    all.front() = first_of_all.get();
    return client.send(share_frame(), all);
  });
  EXPECT_TRUE(eventually([&] { return current_belongings().descriptors <= before + 4; }));
  expect_served();
  server.reset();
}

TEST_F(LingeringTest, WhatIsLeftUnreadHoldsNobodyUp) {
  send_and_leave(true, [&](raw_client& client) {
    return client.send(share_frame(), {lingering().get()}) &&
           client.send(share_frame(), {lingering().get(), lingering().get()});
  });
  EXPECT_TRUE(has_let_go());
  server.reset();
}

TEST_F(LingeringTest, ASocketWithinASocketHoldsNobodyUp) {
  send_and_leave(false, [&](raw_client& client) { return client.send(share_frame(), {lingering_within().get()}); });
  expect_served();
  server.reset();
}

TEST_F(LingeringTest, PlacesAreNotKeptByWhatTakesItsTime) {
  server_limits limits;
  limits.allow_connections(12);
  serve(limits);
  for (int i = 0; i < 20; ++i) {
    send_and_leave(i % 2 == 0,
                   [&](raw_client& client) { return client.send(share_frame(), {lingering_within().get()}); });
  }
  server.reset();
}

TEST_F(LingeringTest, WhatIsUnreadWhenTheServerEndsDoesNotHoldItUp) {
  serve();
  held_command command(first);
  const auto client = greeted(), stays = greeted();
  const bytes frame =
      raw_frame(frame_kind::invoke, body_of(remote::invoke_request{client->must_open(first_ta::uuid), 5, {}}));
  client->send(frame);
  command.wait_until_it_runs();
  EXPECT_TRUE(client->send(share_frame(), {lingering().get(), lingering().get()}));
  client->close();
  server->stop();
  command.let_go();
  server.reset();
  EXPECT_TRUE(stays->is_closed());
}

/// A server with clients that came before it looks.
class EarlyTest : public LingeringTest {
 protected:
  EarlyTest() : file_(path(), 0600) {
    server_limits limits;
    limits.allow_connections(1);
    early_.emplace(server_options{world, "the test's folder", file_.take(), limits, {}});
  }
  ~EarlyTest() override {
    early_->stop();
    if (thread_.joinable()) thread_.join();
  }

  void run() {
    thread_ = std::thread([this] { early_->run(); });
  }

  listening_socket file_;
  std::optional<class server> early_;
  std::thread thread_;
};

TEST_F(EarlyTest, NewcomersThatAreTurnedAwayHoldNobodyUp) {
  raw_client taken(path());
  for (int i = 0; i < 40; ++i) {
    raw_client crowd(path());
    ASSERT_TRUE(crowd.send(share_frame(), {i % 2 == 0 ? lingering().get() : lingering_within().get()}));
  }
  raw_client last(path());
  run();
  taken.greet();
  EXPECT_EQ(last.refusal_after(raw_frame(frame_kind::hello)), remote::refusal::crowded);
}

TEST_F(EarlyTest, NewcomersThatNobodyTookInDoNotHoldTheEndUp) {
  for (int i = 0; i < 10; ++i) {
    raw_client crowd(path());
    ASSERT_TRUE(crowd.send(share_frame(), {lingering().get()}));
  }
  early_->stop();
  run();
}

}  // namespace
}  // namespace hosted_tee::testing
