// kmctl tee: a server of the hosted TEE, looked at from outside.
#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <limits>
#include <string>
#include <string_view>

#include "client/kmctl/commands.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/number_option.h"
#include "client/lib/error.h"
#include "tee/client/management.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using hosted_tee::server_management;

constexpr const char* status_examples =
    "Operations are the handles that a TA has open for its cryptography. They are not the operations of its\n"
    "clients, which can't be seen from outside: the Keymaster TA has places for 16 of those, and each takes one\n"
    "handle or two. Signatures of RSA and EC with a digest take two, all else takes one. Heap is in bytes: in use,\n"
    "the most there ever was since the TA's instance began, and the limit. Only the server's own user and root are\n"
    "answered.\n\n"
    "Examples:\n"
    "  export KEYMASTER_TEE=unix:/run/keymaster/teed.socket\n"
    "  kmctl tee status\n"
    "  kmctl tee status --json | jq '.tas[].heap_peak'\n";

constexpr const char* log_examples =
    "The server keeps the latest lines, errors alone unless it was started with --keep-trace. Only its own user and\n"
    "root are answered.\n\n"
    "Examples:\n"
    "  export KEYMASTER_TEE=unix:/run/keymaster/teed.socket\n"
    "  kmctl tee log\n"
    "  kmctl tee log --lines 20\n"
    "  kmctl tee log --json | jq -r '.lines[].text'\n";

constexpr const char* stop_examples =
    "Commands that run are finished, then all sessions are closed; the command waits until that is done. A server "
    "that\n"
    "systemd starts by its socket comes back with the next client. Only the server's own user and root are obeyed.\n\n"
    "Examples:\n"
    "  kmctl tee stop\n"
    "  kmctl --tee unix:/run/keymaster/teed.socket tee stop\n";

void check(const hosted_tee::management_failure& failed, const char* step, client::error_kind kind) {
  if (failed.result == TEEC_SUCCESS) {
    return;
  }
  throw client::error({.kind = kind, .step = step, .tee_result = failed.result, .tee_origin = failed.origin});
}

/// Connects to the server that `ctx` names.
void connect(server_management& server, const context& ctx) {
  const std::string name = tee_name(ctx);
  const hosted_tee::management_failure failed = server.connect(name);
  if (failed.result == TEEC_ERROR_NOT_SUPPORTED && failed.origin == TEEC_ORIGIN_API) {
    throw usage_error(name + " is no server: it runs only inside the program that uses it",
                      "start one with teed, and name its socket: kmctl --tee unix:PATH tee …");
  }
  check(failed, "connect", client::error_kind::connection);
}

struct status_options {
  void add_to(command_line& command) { command.footer(status_examples); }
};

/// One way to show a number of a record, in text and in JSON.
template <class Record>
struct number_row {
  const char* name;
  const char* title;
  std::uint64_t (*value)(const Record&);
};

using hosted_tee::server_status;
using hosted_tee::ta_status;

constexpr std::array server_rows = std::to_array<number_row<server_status>>({
    {"pid", "process", [](const server_status& s) -> std::uint64_t { return s.pid; }},
    {"uptime_ms", "up for ms", [](const server_status& s) { return s.uptime_ms; }},
    {"connections", "connections", [](const server_status& s) -> std::uint64_t { return s.connections; }},
    {"accepted", "  accepted", [](const server_status& s) { return s.accepted; }},
    {"refused", "  refused", [](const server_status& s) { return s.refused; }},
    {"dropped", "  dropped", [](const server_status& s) { return s.dropped; }},
    {"sessions", "sessions", [](const server_status& s) -> std::uint64_t { return s.sessions; }},
    {"commands", "commands", [](const server_status& s) { return s.commands; }},
    {"shared_blocks", "shared blocks", [](const server_status& s) -> std::uint64_t { return s.shared_blocks; }},
    {"shared_bytes", "shared bytes", [](const server_status& s) { return s.shared_bytes; }},
    {"trace_lines", "trace lines", [](const server_status& s) -> std::uint64_t { return s.trace_kept; }},
    {"trace_total", "  since start", [](const server_status& s) { return s.trace_total; }},
});

constexpr std::array ta_rows = std::to_array<number_row<ta_status>>({
    {"sessions", "  sessions", [](const ta_status& t) -> std::uint64_t { return t.sessions; }},
    {"operations", "  operations", [](const ta_status& t) -> std::uint64_t { return t.operations; }},
    {"heap", "  heap", [](const ta_status& t) -> std::uint64_t { return t.heap_bytes; }},
    {"heap_peak", "  heap peak", [](const ta_status& t) -> std::uint64_t { return t.heap_peak; }},
    {"heap_limit", "  heap limit", [](const ta_status& t) -> std::uint64_t { return t.heap_limit; }},
    {"transient_objects", "  keys in memory", [](const ta_status& t) -> std::uint64_t { return t.transient_objects; }},
    {"persistent_objects", "  open objects", [](const ta_status& t) -> std::uint64_t { return t.persistent_objects; }},
});

template <class Record, std::size_t N>
void add(const Record& record, const std::array<number_row<Record>, N>& rows, std::string& text, json& object) {
  for (const auto& row : rows) {
    const std::uint64_t value = row.value(record);
    text += fmt::format("\n{:<20}{}", row.title, value);
    object[row.name] = value;
  }
}

int run_status(const status_options& /*options*/, const context& ctx) {
  server_management server;
  connect(server, ctx);
  server_status now;
  check(server.status(now), "tee_status", client::error_kind::companion);
  std::string text = fmt::format("{:<20}{}\n{:<20}{}", "teed", now.version, "state", now.state);
  json object = {{"version", now.version}, {"state", now.state}};
  add(now, server_rows, text, object);
  object["tas"] = json::array();
  for (const ta_status& ta : now.tas) {
    text += fmt::format("\n{:<20}{}", "TA", ta.ta);
    json entry = {{"ta", ta.ta}};
    add(ta, ta_rows, text, entry);
    object["tas"].push_back(entry);
  }
  tell(ctx, text, object);
  return exit_done;
}

struct log_options {
  std::uint32_t lines = 0;

  void add_to(command_line& command) {
    add_number(command, "-n,--lines", lines, "show the latest N lines alone").type_name("N");
    command.footer(log_examples);
  }
};

std::string_view level_name(std::uint32_t level) {
  constexpr std::array<std::string_view, 4> names{"?", "error", "info", "debug"};
  return level < names.size() ? names[level] : names[0];
}

/// What a TA traces may hold anything; a terminal gets what can be printed.
std::string printable(std::string_view text) {
  std::string out(text);
  std::ranges::replace_if(
      out, [](unsigned char c) { return c < 0x20 || c == 0x7F; }, '?');
  return out;
}

int run_log(const log_options& options, const context& ctx) {
  server_management server;
  connect(server, ctx);
  hosted_tee::server_log log;
  const std::uint64_t most = options.lines != 0 ? options.lines : std::numeric_limits<std::uint64_t>::max();
  check(server.latest_log(most, log), "tee_log", client::error_kind::companion);
  std::string text;
  json lines = json::array();
  for (const auto& line : log.lines) {
    text += fmt::format("{}{} {} {}:{}: {}", text.empty() ? "" : "\n", printable(line.prefix), level_name(line.level),
                        printable(line.function), line.line, printable(line.text));
    lines.push_back({{"number", line.number},
                     {"prefix", line.prefix},
                     {"level", level_name(line.level)},
                     {"function", line.function},
                     {"line", line.line},
                     {"text", line.text}});
  }
  tell(ctx, text, {{"lines", lines}});
  return exit_done;
}

struct stop_options {
  void add_to(command_line& command) { command.footer(stop_examples); }
};

int run_stop(const stop_options& /*options*/, const context& ctx) {
  server_management server;
  connect(server, ctx);
  check(server.stop(), "tee_stop", client::error_kind::companion);
  tell(ctx, "The server has ended", {{"stopped", true}});
  return exit_done;
}

constexpr std::array commands = std::to_array<command_row>({
    {"status", "Show sessions, operations, heap and objects", define<status_options, run_status>},
    {"log", "Show the latest lines of the trace", define<log_options, run_log>},
    {"stop", "End the server", define<stop_options, run_stop>},
});

}  // namespace

void define_tee(command_line& group, context& ctx) {
  define_group(group, ctx, commands);
}

}  // namespace kmctl
