#include "tee/client/management.h"

#include <algorithm>
#include <new>
#include <string_view>

#include "tee/client/client_failure.h"
#include "tee/client/request_channel.h"
#include "tee/runtime/uuid.h"

namespace hosted_tee {
namespace {

using remote::frame_kind;

constexpr std::string_view socket_prefix = "unix:";

void expect(const remote::outcome& done) {
  if (done.result != TEEC_SUCCESS) throw client_failure(done.result, done.origin);
}

template <class Body>
management_failure guarded(Body&& body) {
  try {
    body();
    return {};
  } catch (const client_failure& failure) {
    return {failure.code(), failure.origin()};
  } catch (const std::bad_alloc&) {
    return {TEEC_ERROR_OUT_OF_MEMORY, TEEC_ORIGIN_API};
  }
}

ta_status to_status(const remote::instance_entry& entry) {
  return {.ta = to_text(from_bytes(entry.ta)),
          .sessions = entry.sessions,
          .operations = entry.operations,
          .heap_bytes = entry.heap_bytes,
          .heap_peak = entry.heap_peak,
          .heap_limit = entry.heap_limit,
          .transient_objects = entry.transient_objects,
          .persistent_objects = entry.persistent_objects};
}

server_status to_status(const remote::status_answer& answer) {
  server_status out{.version = answer.version,
                    .state = answer.state,
                    .pid = answer.pid,
                    .uptime_ms = answer.uptime_ms,
                    .connections = answer.connections,
                    .accepted = answer.accepted,
                    .refused = answer.refused,
                    .dropped = answer.dropped,
                    .sessions = answer.sessions,
                    .commands = answer.commands,
                    .shared_blocks = answer.shared_blocks,
                    .shared_bytes = answer.shared_bytes,
                    .trace_total = answer.trace_total,
                    .trace_kept = answer.trace_kept,
                    .tas = {}};
  for (const auto& entry : answer.instances) out.tas.push_back(to_status(entry));
  return out;
}

server_log_line to_line(const remote::log_line& line) {
  std::string_view text = line.text;
  while (!text.empty() && text.back() == '\n') text.remove_suffix(1);
  return {line.number, line.level, line.line, line.prefix, line.function, std::string(text)};
}

}  // namespace

struct server_management::channel {
  explicit channel(const std::string& path) : requests(path) {}
  request_channel requests;
};

server_management::server_management() = default;
server_management::~server_management() = default;

management_failure server_management::connect(const std::string& name) {
  return guarded([&] {
    if (!name.starts_with(socket_prefix)) throw client_failure(TEEC_ERROR_NOT_SUPPORTED);
    channel_ = std::make_unique<channel>(name.substr(socket_prefix.size()));
  });
}

request_channel& server_management::requests() {
  if (channel_ == nullptr) throw client_failure(TEEC_ERROR_COMMUNICATION);
  return channel_->requests;
}

remote::status_answer server_management::asked_status() {
  remote::status_answer answer;
  requests().ask(frame_kind::status, remote::empty_request{}, answer);
  expect(answer.done);
  return answer;
}

management_failure server_management::status(server_status& out) {
  return guarded([&] { out = to_status(asked_status()); });
}

// A trace may grow faster than it is read, and forget lines that were to come: neither moves the end.
void server_management::read_lines(std::uint64_t from, std::uint64_t end, server_log& out) {
  out = {{}, from};
  for (bool at_end = false; !at_end && out.next < end;) {
    remote::log_answer answer;
    requests().ask(frame_kind::log, remote::log_request{out.next}, answer);
    expect(answer.done);
    if (!answer.at_end && answer.next <= out.next) requests().break_off();
    for (const auto& line : answer.lines) {
      if (line.number < end) out.lines.push_back(to_line(line));
    }
    out.next = std::min(answer.next, end);
    at_end = answer.at_end;
  }
}

management_failure server_management::log(std::uint64_t from, server_log& out) {
  return guarded([&] { read_lines(from, asked_status().trace_total, out); });
}

management_failure server_management::latest_log(std::uint64_t count, server_log& out) {
  return guarded([&] {
    const std::uint64_t end = asked_status().trace_total;
    read_lines(end - std::min(count, end), end, out);
  });
}

management_failure server_management::stop() {
  return guarded([&] {
    remote::plain_answer answer;
    requests().ask(frame_kind::stop, remote::empty_request{}, answer);
    expect(answer.done);
    requests().wait_for_end();
  });
}

}  // namespace hosted_tee
