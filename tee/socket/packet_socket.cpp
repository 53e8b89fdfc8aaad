#include "tee/socket/packet_socket.h"

#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <system_error>

namespace hosted_tee {
namespace {

// One is all that a frame ever needs, and the control message's padding has room for a second. With room for as many as
// can be sent a client could have the server hold them.
constexpr std::size_t control_size = CMSG_SPACE(sizeof(int));
constexpr std::size_t most_descriptors = 2;

[[noreturn]] void fail(int error, const std::string& what) {
  throw std::system_error(error, std::generic_category(), what);
}

void limit(int socket, int option, std::chrono::seconds seconds) {
  const timeval limit{static_cast<time_t>(seconds.count()), 0};
  if (::setsockopt(socket, SOL_SOCKET, option, &limit, sizeof limit) != 0) fail(errno, "setsockopt");
}

std::vector<file_descriptor> take_descriptors(msghdr& message) {
  std::array<file_descriptor, most_descriptors> own;  // before anything can fail
  std::size_t count = 0;
  for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t here = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < here && count < own.size(); ++i) {
      int fd = -1;
      std::memcpy(&fd, CMSG_DATA(part) + i * sizeof fd, sizeof fd);
      own[count++] = file_descriptor(fd);
    }
  }
  std::vector<file_descriptor> taken;
  taken.reserve(count);
  for (std::size_t i = 0; i < count; ++i) taken.push_back(std::move(own[i]));
  return taken;
}

/// What recvmsg fills in.
class incoming_packet {
 public:
  explicit incoming_packet(std::span<std::uint8_t> room) : part_{room.data(), room.size()} {
    message_.msg_iov = &part_;
    message_.msg_iovlen = 1;
    message_.msg_control = control_.data();
    message_.msg_controllen = control_.size();
  }
  incoming_packet(const incoming_packet&) = delete;
  incoming_packet& operator=(const incoming_packet&) = delete;
  ~incoming_packet() = default;

  ssize_t look(int socket) { return ::recvmsg(socket, &message_, MSG_CMSG_CLOEXEC | MSG_DONTWAIT); }

  ssize_t receive_sleeping(int socket) {
    bool was_reset = false;
    for (;;) {
      const ssize_t size = ::recvmsg(socket, &message_, MSG_CMSG_CLOEXEC);
      if (size >= 0 || (errno != EINTR && errno != ECONNRESET) || was_reset) return size;
      // Told once when the other side closed with something of ours unread. What it said before comes behind that.
      was_reset = errno == ECONNRESET;
    }
  }

  /// told is what a call's answer means.
  received told(ssize_t size) {
    if (size < 0) return {errno == EAGAIN ? arrival::overdue : arrival::end, 0, {}};
    received taken{arrival::packet, static_cast<std::size_t>(size), {}};
    if (message_.msg_controllen != 0) taken.descriptors = take_descriptors(message_);
    const bool is_cut = (message_.msg_flags & MSG_CTRUNC) != 0;
    taken.has_lost = is_cut && taken.descriptors.empty();
    if ((message_.msg_flags & MSG_TRUNC) != 0 || (is_cut && !taken.has_lost)) {
      taken.how = arrival::unfit;
    } else if (size == 0) {
      taken.how = arrival::end;
    }
    return taken;
  }

 private:
  iovec part_;
  alignas(cmsghdr) std::array<std::uint8_t, control_size> control_;
  msghdr message_{};
};

}  // namespace

sockaddr_un socket_address(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.empty()) fail(EINVAL, "the path of the socket is empty");
  if (path.size() >= sizeof address.sun_path) fail(ENAMETOOLONG, path);
  std::copy(path.begin(), path.end(), std::begin(address.sun_path));
  return address;
}

file_descriptor connect_to(const std::string& path) {
  const sockaddr_un address = socket_address(path);
  file_descriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
  if (!socket.is_open()) fail(errno, "socket");
  int result = 0;
  do {
    result = ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
  } while (result != 0 && errno == EINTR);
  if (result != 0) fail(errno, path);
  return socket;
}

void limit_receiving(int socket, std::chrono::seconds seconds) {
  limit(socket, SO_RCVTIMEO, seconds);
}

void limit_sending(int socket, std::chrono::seconds seconds) {
  limit(socket, SO_SNDTIMEO, seconds);
}

int send_packet(int socket, std::span<const std::uint8_t> packet, int passed) {
  iovec part{const_cast<std::uint8_t*>(packet.data()), packet.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  alignas(cmsghdr) std::array<std::uint8_t, control_size> control{};
  if (passed >= 0) {
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    cmsghdr* const head = CMSG_FIRSTHDR(&message);
    head->cmsg_level = SOL_SOCKET;
    head->cmsg_type = SCM_RIGHTS;
    head->cmsg_len = CMSG_LEN(sizeof passed);
    std::memcpy(CMSG_DATA(head), &passed, sizeof passed);
  }
  ssize_t sent = 0;
  do {
    sent = ::sendmsg(socket, &message, MSG_NOSIGNAL);
  } while (sent < 0 && errno == EINTR);
  return sent < 0 ? errno : 0;
}

received receive_packet(int socket, std::span<std::uint8_t> room) {
  incoming_packet incoming(room);
  return incoming.told(incoming.receive_sleeping(socket));
}

std::optional<received> look_for_packet(int socket, std::span<std::uint8_t> room) {
  incoming_packet incoming(room);
  const ssize_t size = incoming.look(socket);
  if (size < 0 && (errno == EAGAIN || errno == EINTR)) return std::nullopt;
  return incoming.told(size < 0 ? incoming.receive_sleeping(socket) : size);
}

}  // namespace hosted_tee
