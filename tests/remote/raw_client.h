// A client that keeps no rule: packets and descriptors as a test puts them together.
#ifndef TESTS_REMOTE_RAW_CLIENT_H_
#define TESTS_REMOTE_RAW_CLIENT_H_

#include <optional>
#include <string>
#include <vector>

#include "tee/remote/frame.h"
#include "tee/remote/messages.h"
#include "tee/runtime/file_descriptor.h"
#include "tests/support/bytes.h"

namespace hosted_tee::testing {

using ::testing_support::bytes;

/// What came back. No kind: the server has closed the connection.
struct raw_answer {
  std::optional<std::uint16_t> kind;
  std::uint16_t version = 0;
  std::uint32_t sequence = 0;
  bytes body;
};

/// raw_frame is a frame of any kind around any body.
bytes raw_frame(std::uint16_t kind, const bytes& body = {}, std::uint32_t sequence = 1);
bytes raw_frame(remote::frame_kind kind, const bytes& body = {}, std::uint32_t sequence = 1);

/// body_of is a message's body.
template <class Message>
bytes body_of(const Message& message) {
  bytes room(remote::frame_limit);
  remote::frame_writer out(room);
  remote::write_body(out, message);
  room.resize(out.size());
  return room;
}

class raw_client {
 public:
  /// Connects to the server at `path`. Every failure of the test's own side throws std::system_error.
  explicit raw_client(const std::string& path);

  /// send answers whether the server's side still took it.
  bool send(const bytes& packet, const std::vector<int>& descriptors = {});

  /// receive waits for the next packet, for at most ten seconds (then it throws).
  raw_answer receive();

  /// ask sends a request and gives the answer's body as a message. Throws std::runtime_error for another kind of
  /// answer.
  template <class Answer, class Request>
  Answer ask(remote::frame_kind kind, const Request& request, const std::vector<int>& descriptors = {}) {
    send(raw_frame(kind, body_of(request)), descriptors);
    kept_ = receive();
    Answer answer;
    require(kept_.kind == remote::answer_to(kind) && remote::read_body(kept_.body, answer));
    return answer;
  }

  void greet() { (void)ask<remote::hello_answer>(remote::frame_kind::hello, remote::empty_request{}); }

  /// open_session opens one to the TA; must_open throws unless it succeeds, and gives its number.
  remote::open_answer open_session(const TEE_UUID& ta, std::uint32_t login = 0, std::uint32_t group = 0);
  std::uint32_t must_open(const TEE_UUID& ta);
  remote::invoke_answer invoke(std::uint32_t session, const remote::request_slots& slots = {});

  /// refusal_after sends a packet and answers with what the server refuses it before it closes; nothing when it closes
  /// without a word or answers.
  std::optional<remote::refusal> refusal_after(const bytes& packet, const std::vector<int>& descriptors = {});

  /// is_closed waits until the server has closed the connection.
  bool is_closed() { return !receive().kind; }

  [[nodiscard]] int socket() const { return socket_.get(); }
  void close() { socket_ = file_descriptor(); }

 private:
  static void require(bool holds);

  file_descriptor socket_;
  raw_answer kept_;  // what an answer's views point into
};

}  // namespace hosted_tee::testing

#endif  // TESTS_REMOTE_RAW_CLIENT_H_
