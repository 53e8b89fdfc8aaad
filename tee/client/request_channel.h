// A connection to a server: requests and their answers, one at a time.
#ifndef TEE_CLIENT_REQUEST_CHANNEL_H_
#define TEE_CLIENT_REQUEST_CHANNEL_H_

#include <sys/types.h>

#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "tee/remote/frame.h"
#include "tee/remote/messages.h"
#include "tee/socket/frame_channel.h"

namespace hosted_tee {

/// Not for two threads at once: an answer's views point into the channel's own room, until the next request. What fails
/// throws client_failure with TEEC_ORIGIN_COMMS; from then on the channel is broken and every request fails alike.
class request_channel {
 public:
  /// Connects to the server at `path`. TEEC_ERROR_BAD_PARAMETERS for a path that no socket can have,
  /// TEEC_ERROR_ACCESS_DENIED when the system forbids it, TEEC_ERROR_BUSY when the server takes no more connections,
  /// TEEC_ERROR_NOT_SUPPORTED when it speaks another version of the wire, TEEC_ERROR_COMMUNICATION when there is no
  /// server.
  explicit request_channel(const std::string& path);

  /// ask sends a request, with a descriptor unless `passed` is -1, and waits for its answer. TEEC_ERROR_COMMUNICATION
  /// when the server is gone, when it answers something else, and in a process that was forked from the one that
  /// connected; TEEC_ERROR_BAD_FORMAT when the server can't make sense of the request; TEEC_ERROR_EXCESS_DATA, without
  /// breaking the channel, for a request that is longer than a frame.
  template <class Request, class Answer>
  void ask(remote::frame_kind kind, const Request& request, Answer& answer, int passed = -1) {
    remote::frame_builder builder(room_, static_cast<std::uint16_t>(kind), ++sequence_);
    remote::write_body(builder.body(), request);
    if (!remote::read_body(exchange(builder.finish(), kind, passed), answer)) break_off();
  }

  /// check_owner throws TEEC_ERROR_COMMUNICATION in a process that was forked from the one that connected.
  void check_owner() const;

  /// break_off is for an answer that can't be one to the request: TEEC_ERROR_COMMUNICATION.
  [[noreturn]] void break_off();

  /// wait_for_end waits until the server has closed the connection.
  void wait_for_end();

 private:
  std::span<const std::uint8_t> exchange(std::span<const std::uint8_t> request, remote::frame_kind kind, int passed);
  [[noreturn]] void explain_refusal(const remote::frame& refused);

  void make_slots();

  frame_channel channel_;
  pid_t owner_;
  std::uint32_t sequence_ = 0;
  std::vector<std::uint8_t> room_;
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_REQUEST_CHANNEL_H_
