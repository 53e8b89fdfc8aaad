// A server whose answers a test writes.
#ifndef TESTS_REMOTE_FALSE_SERVER_H_
#define TESTS_REMOTE_FALSE_SERVER_H_

#include <fcntl.h>
#include <sys/socket.h>

#include <functional>
#include <thread>

#include "tee/server/listener.h"
#include "tee_client_api.h"
#include "tests/remote/raw_client.h"

namespace hosted_tee::testing {

/// It serves one connection.
class false_server {
 public:
  explicit false_server(const std::string& path) : file_(path, 0600), listener_(file_.take()) {}
  ~false_server() { thread_.join(); }
  false_server(const false_server&) = delete;
  false_server& operator=(const false_server&) = delete;

  /// After an honest hello, and a refusal to use slots, it answers every request with what `answer` gives for it;
  /// nothing closes the connection.
  void run(std::function<bytes(const remote::frame&)> answer) {
    thread_ = std::thread([this, answer = std::move(answer)] {
      ::fcntl(listener_.get(), F_SETFL, 0);
      const file_descriptor peer(::accept(listener_.get(), nullptr, nullptr));
      bytes room(remote::frame_limit);
      for (ssize_t size = 0; (size = ::recv(peer.get(), room.data(), room.size(), 0)) > 0;) {
        remote::frame request;
        if (!remote::read_frame({room.data(), static_cast<std::size_t>(size)}, request)) return;
        const bytes told =
            request.header.kind == 1 || request.header.kind == 7 ? honest_answer(request) : answer(request);
        if (told.empty()) return;
        if (::send(peer.get(), told.data(), told.size(), MSG_NOSIGNAL) < 0) return;
      }
    });
  }

 private:
  static bytes honest_answer(const remote::frame& request) {
    if (request.header.kind == 1) {
      return raw_frame(std::uint16_t{0x8001}, body_of(remote::hello_answer{}), request.header.sequence);
    }
    const remote::plain_answer no{{TEEC_ERROR_NOT_SUPPORTED, TEEC_ORIGIN_COMMS}};
    return raw_frame(std::uint16_t{0x8007}, body_of(no), request.header.sequence);
  }

  listening_socket file_;
  file_descriptor listener_;
  std::thread thread_;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_REMOTE_FALSE_SERVER_H_
