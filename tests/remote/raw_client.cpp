#include "tests/remote/raw_client.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <system_error>

#include "tee/runtime/uuid.h"

namespace hosted_tee::testing {
namespace {

[[noreturn]] void fail(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

}  // namespace

bytes raw_frame(std::uint16_t kind, const bytes& body, std::uint32_t sequence) {
  bytes room(remote::header_size + body.size());
  remote::frame_builder builder(room, kind, sequence);
  builder.body().bytes(body);
  const auto frame = builder.finish();
  return {frame.begin(), frame.end()};
}

bytes raw_frame(remote::frame_kind kind, const bytes& body, std::uint32_t sequence) {
  return raw_frame(static_cast<std::uint16_t>(kind), body, sequence);
}

void raw_client::require(bool holds) {
  if (!holds) throw std::runtime_error("the server answered something else");
}

raw_client::raw_client(const std::string& path) : socket_(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0)) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(std::begin(address.sun_path), sizeof address.sun_path - 1);
  if (::connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) fail("connect");
  const timeval limit{10, 0};
  if (::setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit) != 0) fail("setsockopt");
}

bool raw_client::send(const bytes& packet, const std::vector<int>& descriptors) {
  iovec part{const_cast<std::uint8_t*>(packet.data()), packet.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  std::vector<std::uint8_t> control(CMSG_SPACE(descriptors.size() * sizeof(int)));
  if (!descriptors.empty()) {
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    cmsghdr* const head = CMSG_FIRSTHDR(&message);
    head->cmsg_level = SOL_SOCKET;
    head->cmsg_type = SCM_RIGHTS;
    head->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
    std::memcpy(CMSG_DATA(head), descriptors.data(), descriptors.size() * sizeof(int));
  }
  if (::sendmsg(socket_.get(), &message, MSG_NOSIGNAL) >= 0) return true;
  if (errno != EPIPE && errno != ECONNRESET) fail("sendmsg");
  return false;
}

raw_answer raw_client::receive() {
  bytes packet(2 * remote::frame_limit);
  ssize_t size = -1;
  // A reset is told once, before what the server said last.
  for (int i = 0; i < 2 && size < 0; ++i) {
    size = ::recv(socket_.get(), packet.data(), packet.size(), 0);
    if (size < 0 && errno != ECONNRESET) fail("recv");
  }
  if (size <= 0) return {};
  remote::frame frame;
  require(remote::read_frame({packet.data(), static_cast<std::size_t>(size)}, frame));
  return {frame.header.kind, frame.header.version, frame.header.sequence, {frame.body.begin(), frame.body.end()}};
}

remote::open_answer raw_client::open_session(const TEE_UUID& ta, std::uint32_t login, std::uint32_t group) {
  return ask<remote::open_answer>(remote::frame_kind::open_session,
                                  remote::open_request{to_bytes(ta), login, group, {}});
}

std::uint32_t raw_client::must_open(const TEE_UUID& ta) {
  const remote::open_answer answer = open_session(ta);
  require(answer.done.result == 0 && answer.session != 0);
  return answer.session;
}

remote::invoke_answer raw_client::invoke(std::uint32_t session, const remote::request_slots& slots) {
  return ask<remote::invoke_answer>(remote::frame_kind::invoke, remote::invoke_request{session, 5, slots});
}

std::optional<remote::refusal> raw_client::refusal_after(const bytes& packet, const std::vector<int>& descriptors) {
  send(packet, descriptors);
  const raw_answer answer = receive();
  remote::refusal_answer why;
  if (answer.kind != remote::refused_kind || !remote::read_body(answer.body, why) || !is_closed()) return std::nullopt;
  return why.reason;
}

}  // namespace hosted_tee::testing
