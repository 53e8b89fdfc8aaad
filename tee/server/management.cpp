// The requests that only the server's own user and root may make.
#include <unistd.h>

#include <algorithm>

#include "tee/runtime/uuid.h"
#include "tee/server/connection.h"

namespace hosted_tee {
namespace {

using remote::outcome;

constexpr outcome done{TEEC_SUCCESS, TEEC_ORIGIN_TEE};
constexpr outcome denied{TEEC_ERROR_ACCESS_DENIED, TEEC_ORIGIN_COMMS};

// What an answer's instances may take, less than a frame by all that stands before them.
constexpr std::size_t most_instances = 512;
constexpr std::size_t most_lines = 1024;
constexpr std::size_t room_for_lines = remote::frame_limit - 256;

remote::instance_entry to_entry(const instance_status& live) {
  return {.ta = to_bytes(live.ta),
          .sessions = live.sessions,
          .operations = live.held.operations,
          .heap_bytes = live.held.heap_bytes,
          .heap_blocks = live.held.heap_blocks,
          .heap_peak = live.held.heap_peak,
          .heap_limit = live.heap_limit,
          .transient_objects = live.held.transient_objects,
          .persistent_objects = live.held.persistent_objects};
}

remote::log_line to_line(const numbered_line& line) {
  return {.number = line.number,
          .level = static_cast<std::uint32_t>(line.line.level),
          .line = static_cast<std::uint32_t>(line.line.line),
          .prefix = line.line.prefix,
          .function = line.line.function,
          .text = line.line.text};
}

void describe_world(const secure_world& world, remote::status_answer& out) {
  const world_status now = world.status();
  out.sessions = now.sessions;
  out.commands = now.commands;
  out.trace_total = now.trace_total;
  out.trace_kept = now.trace_kept;
  const std::size_t told = std::min(now.instances.size(), most_instances);
  for (std::size_t i = 0; i < told; ++i) out.instances.push_back(to_entry(now.instances[i]));
}

void describe_server(const server_core& core, remote::status_answer& out) {
  const auto uptime = std::chrono::steady_clock::now() - core.started;
  out.version = HOSTED_TEE_VERSION;
  out.state = core.state;
  out.pid = static_cast<std::uint32_t>(::getpid());
  out.uptime_ms = static_cast<std::uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(uptime).count());
  out.connections = core.counters.connections;
  out.accepted = core.counters.accepted;
  out.refused = core.counters.refused;
  out.dropped = core.counters.dropped;
  out.shared_blocks = core.memory.blocks();
  out.shared_bytes = core.memory.bytes();
}

void collect_lines(const secure_world& world, std::uint64_t from, remote::log_answer& out) {
  out.next = from;
  std::size_t used = 0;
  const auto lines = world.trace_lines(from, most_lines);
  out.at_end = lines.size() < most_lines;
  for (const numbered_line& line : lines) {
    remote::log_line told = to_line(line);
    used += remote::log_line_size(told);
    if (used > room_for_lines) {
      out.at_end = false;
      return;
    }
    out.next = line.number + 1;
    out.lines.push_back(std::move(told));
  }
}

}  // namespace

bool connection::may_manage() const {
  return client_.may_manage();
}

bool connection::status(const remote::frame& request, int /*file*/) {
  remote::empty_request nothing;
  if (!remote::read_body(request.body, nothing)) return false;
  remote::status_answer told;
  told.done = may_manage() ? done : denied;
  if (may_manage()) {
    describe_server(core_, told);
    describe_world(*core_.world, told);
  }
  answer(request, told);
  return true;
}

bool connection::log(const remote::frame& request, int /*file*/) {
  remote::log_request asked;
  if (!remote::read_body(request.body, asked)) return false;
  remote::log_answer told;
  told.done = may_manage() ? done : denied;
  if (may_manage()) collect_lines(*core_.world, asked.from, told);
  answer(request, told);
  return true;
}

bool connection::stop(const remote::frame& request, int /*file*/) {
  remote::empty_request nothing;
  if (!remote::read_body(request.body, nothing)) return false;
  answer(request, remote::plain_answer{may_manage() ? done : denied});
  if (may_manage()) {
    asked_to_stop_ = true;
    core_.stop();
  }
  return true;
}

}  // namespace hosted_tee
