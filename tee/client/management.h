// How a program looks at a server of the hosted TEE from outside, and ends it. No part of the Client API.
#ifndef TEE_CLIENT_MANAGEMENT_H_
#define TEE_CLIENT_MANAGEMENT_H_

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "tee_client_api.h"

namespace hosted_tee {

class request_channel;
namespace remote {
struct status_answer;
}

/// One live instance of a TA, with what it holds.
struct ta_status {
  std::string ta;  ///< its UUID, as text
  std::uint32_t sessions = 0;
  std::uint32_t operations = 0;  ///< live operation handles
  std::uint32_t heap_bytes = 0, heap_peak = 0, heap_limit = 0;
  std::uint32_t transient_objects = 0, persistent_objects = 0;
};

/// A server and its device at one moment.
struct server_status {
  std::string version;
  std::string state;  ///< the state folder
  std::uint32_t pid = 0;
  std::uint64_t uptime_ms = 0;
  std::uint32_t connections = 0;  ///< this one included
  std::uint64_t accepted = 0;     ///< connections since the start, as the two that follow
  std::uint64_t refused = 0;      ///< for want of room
  std::uint64_t dropped = 0;      ///< for what came on them
  std::uint32_t sessions = 0;
  std::uint64_t commands = 0;  ///< since the start
  std::uint32_t shared_blocks = 0;
  std::uint64_t shared_bytes = 0;
  std::uint64_t trace_total = 0;  ///< lines since the start
  std::uint32_t trace_kept = 0;
  std::vector<ta_status> tas;
};

/// A line of the device's trace. `level` is 1 for an error, 2 for information, 3 for debugging.
struct server_log_line {
  std::uint64_t number = 0;  ///< the device's first line has number 0
  std::uint32_t level = 0;
  std::uint32_t line = 0;
  std::string prefix, function, text;  ///< without the newline at the end
};

/// The lines from a number on, and where to go on reading.
struct server_log {
  std::vector<server_log_line> lines;
  std::uint64_t next = 0;
};

/// What went wrong: a result of the Client API with its origin.
struct management_failure {
  TEEC_Result result = TEEC_SUCCESS;
  std::uint32_t origin = TEEC_ORIGIN_API;
};

/// A connection for management, which a server grants to its own user and to root. All functions answer a failure whose
/// result is TEEC_SUCCESS when there was none; TEEC_ERROR_ACCESS_DENIED says that the user is another one,
/// TEEC_ERROR_COMMUNICATION that the server is gone.
class server_management {
 public:
  server_management();
  server_management(const server_management&) = delete;
  server_management& operator=(const server_management&) = delete;
  ~server_management();

  /// connect takes the name of a context, which must be of the form unix:PATH: TEEC_ERROR_NOT_SUPPORTED for a name of
  /// another kind, else as TEEC_InitializeContext. It comes before all others.
  [[nodiscard]] management_failure connect(const std::string& name);

  [[nodiscard]] management_failure status(server_status& out);

  /// log gives the lines from number `from` on that are there when it is asked, without those that the trace has
  /// forgotten or forgets meanwhile; latest_log the last `count` of them. What is traced later is not waited for: it
  /// follows from out.next on.
  [[nodiscard]] management_failure log(std::uint64_t from, server_log& out);
  [[nodiscard]] management_failure latest_log(std::uint64_t count, server_log& out);

  /// stop asks the server to end, and waits until it has.
  [[nodiscard]] management_failure stop();

 private:
  struct channel;
  [[nodiscard]] request_channel& requests();
  [[nodiscard]] remote::status_answer asked_status();
  void read_lines(std::uint64_t from, std::uint64_t end, server_log& out);

  std::unique_ptr<channel> channel_;
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_MANAGEMENT_H_
