// The bodies of all frames, as records. Each read answers false for anything but exactly such a body, and each write
// puts one behind a frame's header; views point into the packet that was read.
#ifndef TEE_REMOTE_MESSAGES_H_
#define TEE_REMOTE_MESSAGES_H_

#include <array>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "tee/remote/parameters.h"
#include "tee/remote/wire.h"

namespace hosted_tee::remote {

/// What stands at the front of every answer but a refusal: a result of the Client API and its origin.
struct outcome {
  std::uint32_t result = 0;
  std::uint32_t origin = 0;
};

/// Requests without a body of their own: hello, status, stop.
struct empty_request {};

/// Answers that are an outcome alone: of closing a session, releasing memory, stopping the server.
struct plain_answer {
  outcome done;
};

struct refusal_answer {
  refusal reason = refusal::malformed;
};

struct hello_answer {
  outcome done;
  std::uint32_t frame_limit = 0;
  std::uint32_t session_limit = 0;  ///< of this connection
  std::uint32_t block_limit = 0;    ///< blocks of shared memory of this connection
  std::uint64_t memory_limit = 0;   ///< bytes of all those blocks
};

struct open_request {
  std::array<std::uint8_t, 16> ta{};  ///< the UUID in the order of its text form
  std::uint32_t login = 0;
  std::uint32_t group = 0;  ///< of the group logins; 0 for all others
  request_slots params;
};
struct open_answer {
  outcome done;
  std::uint32_t session = 0;
  answer_slots params;
};

struct invoke_request {
  std::uint32_t session = 0;
  std::uint32_t command = 0;
  request_slots params;
};
struct invoke_answer {
  outcome done;
  answer_slots params;
};

struct close_request {
  std::uint32_t session = 0;
};

struct share_request {
  std::uint32_t size = 0;   ///< in bytes; the file has at least as many
  std::uint32_t flags = 0;  ///< TEEC_MEM_INPUT, TEEC_MEM_OUTPUT: the directions that references may have
};
struct share_answer {
  outcome done;
  std::uint32_t block = 0;
};

struct release_request {
  std::uint32_t block = 0;
};

/// One live instance of a TA.
struct instance_entry {
  std::array<std::uint8_t, 16> ta{};
  std::uint32_t sessions = 0;
  std::uint32_t operations = 0;
  std::uint32_t heap_bytes = 0, heap_blocks = 0, heap_peak = 0, heap_limit = 0;
  std::uint32_t transient_objects = 0, persistent_objects = 0;
};

struct status_answer {
  outcome done;
  std::string version;
  std::string state;  ///< the state folder
  std::uint32_t pid = 0;
  std::uint64_t uptime_ms = 0;
  std::uint32_t connections = 0;
  std::uint64_t accepted = 0, refused = 0, dropped = 0;  ///< connections since the start
  std::uint32_t sessions = 0;
  std::uint64_t commands = 0;  ///< since the start
  std::uint32_t shared_blocks = 0;
  std::uint64_t shared_bytes = 0;
  std::uint64_t trace_total = 0;  ///< lines that the trace has kept since the start
  std::uint32_t trace_kept = 0;   ///< lines that it still has
  std::vector<instance_entry> instances;
};

struct log_request {
  std::uint64_t from = 0;  ///< the number of the first line that is wanted; the oldest that is kept when it is gone
};
struct log_line {
  std::uint64_t number = 0;
  std::uint32_t level = 0;
  std::uint32_t line = 0;
  std::string prefix, function, text;
};
struct log_answer {
  outcome done;
  std::uint64_t next = 0;  ///< where to go on
  bool at_end = true;      ///< whether there were no more
  std::vector<log_line> lines;
};

/// Both are there for each of the records above that is a body.
template <class Message>
[[nodiscard]] bool read_body(std::span<const std::uint8_t> body, Message& message);
template <class Message>
void write_body(frame_writer& out, const Message& message);

/// log_line_size is what a line takes in an answer.
[[nodiscard]] std::size_t log_line_size(const log_line& line);

}  // namespace hosted_tee::remote

#endif  // TEE_REMOTE_MESSAGES_H_
