// Both sides of a channel in one thread: what one does between two steps of the other is done within a system call.
#include "tee/socket/frame_channel.h"

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <array>
#include <functional>
#include <utility>

#include "tests/support/bytes.h"

namespace {

/// What happens, once, before the next recvmsg, which has these flags.
std::function<void(int flags)> before_recvmsg;

}  // namespace

// The program's own definition hides the system's.
extern "C" ssize_t recvmsg(int fd, msghdr* message, int flags) {
  static const auto real = reinterpret_cast<decltype(&::recvmsg)>(dlsym(RTLD_NEXT, __func__));
  if (const auto happens = std::exchange(before_recvmsg, nullptr)) happens(flags);
  return real(fd, message, flags);
}

namespace hosted_tee {
namespace {

using ::testing_support::bytes;
using side = frame_channel::side;

constexpr slot_layout layout{64};

/// Two channels that are each other's other side.
struct channel_pair {
  explicit channel_pair(side mine) : channel_pair(mine, make_shared_file(layout.size()), socket_pair()) {}

  frame_channel own, other;

 private:
  using descriptors = std::pair<file_descriptor, file_descriptor>;
  static descriptors socket_pair() {
    std::array<int, 2> ends{-1, -1};
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()), 0);
    return {file_descriptor(ends[0]), file_descriptor(ends[1])};
  }

  channel_pair(side mine, shared_file file, descriptors ends)
      : own(std::move(ends.first)), other(std::move(ends.second)) {
    own.use_slots(std::move(file.memory), layout, mine);
    other.use_slots(*map_file(file.file.get(), layout.size()), layout, mine == side::asks ? side::answers : side::asks);
  }
};

class FrameChannelTest : public ::testing::TestWithParam<side> {
 protected:
  void SetUp() override {
    if (!frame_channel::wants_slots()) GTEST_SKIP() << "slots take two processors";
  }
};

// As of a server that answers a command and ends. Whoever waits may sleep before it looks at the socket, which then
// says of the frame itself; so it is tried until it has looked.
TEST_P(FrameChannelTest, AFrameThatIsPutAfterALookAtTheSlotIsTakenBeforeTheEndThatTheSocketTellsOf) {
  const bytes frame(20, 0x3C);
  bytes room(layout.longest);
  bool has_looked = false;
  for (int i = 0; i < 1000 && !has_looked; ++i) {
    channel_pair channels(GetParam());
    before_recvmsg = [&](int flags) {
      has_looked = (flags & MSG_DONTWAIT) != 0;
      EXPECT_EQ(channels.other.put(frame), 0);
      channels.other.close();
    };
    const received taken = channels.own.receive(room);
    ASSERT_EQ(taken.how, arrival::packet);
    EXPECT_EQ(taken.by, way::slot);
    EXPECT_EQ(bytes(room.begin(), room.begin() + static_cast<std::ptrdiff_t>(taken.size)), frame);
    EXPECT_EQ(channels.own.receive(room).how, arrival::end);
  }
  EXPECT_TRUE(has_looked);
}

INSTANTIATE_TEST_SUITE_P(BothSides, FrameChannelTest, ::testing::Values(side::asks, side::answers),
                         [](const auto& which) { return which.param == side::asks ? "Asks" : "Answers"; });

}  // namespace
}  // namespace hosted_tee
