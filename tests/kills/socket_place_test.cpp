// Who gets a socket's path when many want it at once. The contenders are threads, so that they meet far more often than
// processes would.
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <atomic>
#include <barrier>
#include <filesystem>
#include <fstream>
#include <thread>
#include <vector>

#include "tee/server/listener.h"
#include "tee/socket/packet_socket.h"
#include "tests/kills/kill_place.h"

namespace hosted_tee::testing {
namespace {

constexpr int contenders = 4;
constexpr int turns = 80;

bool has_visitor(int listener) {
  return file_descriptor(::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC)).is_open();
}

class SocketPlaceTest : public ::testing::Test {
 protected:
  /// Whoever goes to the path now comes out at this listener and at no other.
  void expect_leads_to(int listener) const {
    file_descriptor visitor;
    ASSERT_NO_THROW(visitor = connect_to(path));
    EXPECT_TRUE(has_visitor(listener)) << "the path leads to another server";
  }
  [[nodiscard]] std::vector<std::string> left() const {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(folder.path()))
      names.push_back(entry.path().filename());
    return names;
  }

  const kill_folder folder;
  const std::string path = folder.path() / "tee.sock";
};

TEST_F(SocketPlaceTest, OneOfManyThatComeAtOnceGetsThePathWhateverWasLeftThere) {
  std::barrier together(contenders);
  std::atomic<int> winners = 0;
  const auto contend = [&](int which) {
    for (int turn = 0; turn < turns; ++turn) {
      if (which == 0 && turn % 2 == 1) {
        const file_descriptor dead(::socket(AF_UNIX, SOCK_SEQPACKET, 0));
        const sockaddr_un address = socket_address(path);
        EXPECT_EQ(::bind(dead.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
      }
      together.arrive_and_wait();
      std::optional<listening_socket> own;
      try {
        own.emplace(path, 0600);
        ++winners;
      } catch (const socket_taken&) {
      } catch (const std::exception& error) {
        ADD_FAILURE() << error.what();
      }
      together.arrive_and_wait();
      if (own) expect_leads_to(own->take().get());
      together.arrive_and_wait();
      own.reset();
      together.arrive_and_wait();
      if (which == 0) {
        EXPECT_EQ(winners.exchange(0), 1) << "in turn " << turn;
        EXPECT_EQ(left(), std::vector<std::string>()) << "in turn " << turn;
      }
      together.arrive_and_wait();
    }
  };
  std::vector<std::jthread> threads;
  for (int i = 0; i < contenders; ++i) threads.emplace_back(contend, i);
}

TEST_F(SocketPlaceTest, ThePathLeadsToWhoHasItForAsLongAsHeHasItWhileOthersComeAndGo) {
  std::atomic<int> holders = 0, turns_had = 0;
  const auto contend = [&] {
    while (turns_had < 10 * turns && !HasFailure()) {
      try {
        listening_socket own(path, 0600);
        EXPECT_EQ(++holders, 1);
        const file_descriptor listener = own.take();
        for (int visit = 0; visit < 3; ++visit) expect_leads_to(listener.get());
        ++turns_had;
        --holders;
      } catch (const socket_taken&) {
        std::this_thread::yield();
      } catch (const std::exception& error) {
        ADD_FAILURE() << error.what();
      }
    }
  };
  {
    std::vector<std::jthread> threads;
    for (int i = 0; i < contenders; ++i) threads.emplace_back(contend);
  }
  EXPECT_EQ(left(), std::vector<std::string>());
}

// The lock's file comes and goes with its holders: who opened the file of one that ends must not take it for the lock.
TEST_F(SocketPlaceTest, TheRightToAPathHasOneHolderAtATime) {
  constexpr int takings = 10000;
  std::atomic<int> holders = 0, taken = 0;
  const auto contend = [&] {
    while (taken < takings && !HasFailure()) {
      const std::optional<path_lock> right = path_lock::take(path);
      if (!right) {
        std::this_thread::yield();
        continue;
      }
      EXPECT_EQ(++holders, 1);
      ++taken;
      --holders;
    }
  };
  {
    std::vector<std::jthread> threads;
    for (int i = 0; i < contenders; ++i) threads.emplace_back(contend);
  }
  EXPECT_EQ(left(), std::vector<std::string>());
}

TEST_F(SocketPlaceTest, WhatAKilledServerLeftIsReplacedAndGoesWithTheNext) {
  for (const char* name : {"tee.sock", "tee.sock.new"}) {
    const file_descriptor dead(::socket(AF_UNIX, SOCK_SEQPACKET, 0));
    const sockaddr_un address = socket_address(folder.path() / name);
    ASSERT_EQ(::bind(dead.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  }
  std::ofstream(folder.path() / "tee.sock.lock").close();
  {
    listening_socket own(path, 0600);
    expect_leads_to(own.take().get());
  }
  EXPECT_EQ(left(), std::vector<std::string>());
}

TEST_F(SocketPlaceTest, FilesOfOthersBesideTheSocketAreLeftAlone) {
  std::ofstream(folder.path() / "tee.sock.new") << "Dear reader";
  EXPECT_THROW(listening_socket(path, 0600), std::system_error);
  std::string text;
  std::getline(std::ifstream(folder.path() / "tee.sock.new"), text);
  EXPECT_EQ(text, "Dear reader");
  EXPECT_FALSE(std::filesystem::exists(path));
}

TEST_F(SocketPlaceTest, ThePathMayHaveAsManyBytesAsItIsSaid) {
  constexpr std::size_t longest = 103;
  const std::string long_path = path + std::string(longest - path.size(), 'x');
  listening_socket own(long_path, 0600);
  EXPECT_NO_THROW((void)connect_to(long_path));
  EXPECT_THROW(listening_socket(long_path + "x", 0600), std::system_error);
}

}  // namespace
}  // namespace hosted_tee::testing
