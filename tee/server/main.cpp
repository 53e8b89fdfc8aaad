// teed: the secure world as a server for many programs.
#include <fmt/format.h>
#include <sys/resource.h>
#include <sys/signalfd.h>

#include <CLI/CLI.hpp>
#include <csignal>
#include <cstdio>
#include <cstdlib>

#include "tee/client/default_folder.h"
#include "tee/server/listener.h"
#include "tee/server/notify.h"
#include "tee/server/server.h"

namespace hosted_tee {
namespace {

enum exit_code : int { exit_done = 0, exit_failure = 1, exit_usage = 2, exit_no_state = 3, exit_socket_taken = 4 };

constexpr const char* description =
    "teed runs the secure world of a device and serves it to many programs at once, on a Unix socket.\n\n"
    "  teed --state /tmp/device --socket /tmp/tee.sock &\n"
    "  kmctl --tee unix:/tmp/tee.sock info\n"
    "  kmctl --tee unix:/tmp/tee.sock tee stop\n";

constexpr const char* footer =
    "Environment:\n"
    "  KEYMASTER_STATE    the state folder, as --state\n"
    "  KEYMASTER_TRACE    error, info or debug: the trace on standard error, as --trace\n"
    "  KEYMASTER_TA_PATH  the folder of the TA images\n"
    "  LISTEN_FDS         socket activation: the socket is passed, and --socket does not count\n"
    "  NOTIFY_SOCKET      where to tell that the server is ready, and that it stops\n\n"
    "Exit codes:\n"
    "  0  ended as it was told to\n"
    "  1  failure (the socket, the system)\n"
    "  2  wrong usage\n"
    "  3  the state folder can't be used: another process has it, or its content is at fault\n"
    "  4  another server answers at the socket\n\n"
    "SIGTERM and SIGINT end it: commands that run are finished, all sessions closed.\n";

struct settings {
  std::string state;
  std::string socket;
  std::string mode = "0600";
  std::string kept_trace = "error";
  server_limits limits;
  std::uint64_t memory_mib = 256;
};

void say(const std::string& text) {
  (void)std::fputs(("teed: " + text + "\n").c_str(), stderr);
}

void add_options(CLI::App& app, settings& chosen) {
  app.add_option("--state", chosen.state, "folder of the device's state; made when it is not there")
      ->type_name("FOLDER");
  app.add_option("--socket", chosen.socket, "path of the socket (default: teed.sock in the state folder)")
      ->type_name("PATH");
  app.add_option("--socket-mode", chosen.mode, "permissions of the socket's file, octal (default: 0600)")
      ->check(CLI::Validator(
          [](const std::string& text) {
            const bool is_octal = text.find_first_not_of("01234567") == std::string::npos && text.size() <= 4;
            return is_octal && !text.empty() && std::stoul(text, nullptr, 8) <= 0777 ? "" : "not a mode like 0660";
          },
          "MODE"))
      ->type_name("MODE");
  app.add_option_function<std::string>(
         "--trace", [](const std::string& level) { ::setenv("KEYMASTER_TRACE", level.c_str(), 1); },
         "print the trace on standard error: error, info or debug")
      ->check(CLI::IsMember({"error", "info", "debug"}))
      ->type_name("LEVEL");
  app.add_option("--keep-trace", chosen.kept_trace,
                 "what to keep of the trace for kmctl tee log: error, info or debug (default: error)")
      ->check(CLI::IsMember({"error", "info", "debug"}))
      ->type_name("LEVEL");
  app.add_option("--max-connections", chosen.limits.connections, "connections at once (default: 512)")
      ->check(CLI::Range(1, 10000))
      ->type_name("N");
  app.add_option("--max-sessions", chosen.limits.sessions, "sessions of a connection (default: 64)")
      ->check(CLI::Range(1, 10000))
      ->type_name("N");
  app.add_option("--max-memory", chosen.memory_mib,
                 "shared memory of a process, in MiB; all together have four times as much (default: 256)")
      ->check(CLI::Range(1, 65536))
      ->type_name("MIB");
  app.set_version_flag("--version", "teed " HOSTED_TEE_VERSION, "print the version");
  app.footer(footer);
}

trace_level level_of(const std::string& name) {
  if (name == "debug") return trace_level::debug;
  return name == "info" ? trace_level::info : trace_level::error;
}

// A connection takes two descriptors, and the usual soft limit is made for programs that use select.
void raise_descriptor_limit() {
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  (void)::setrlimit(RLIMIT_NOFILE, &limit);
}

// Blocked in all threads, and read from a descriptor by one. Nobody's reading of the trace is not the server's end.
file_descriptor take_signals() {
  (void)::signal(SIGPIPE, SIG_IGN);
  sigset_t set;
  sigemptyset(&set);
  sigaddset(&set, SIGTERM);
  sigaddset(&set, SIGINT);
  if (::pthread_sigmask(SIG_BLOCK, &set, nullptr) != 0) throw std::runtime_error("the signals can't be blocked");
  file_descriptor signals(::signalfd(-1, &set, SFD_CLOEXEC));
  if (!signals.is_open()) throw std::system_error(errno, std::generic_category(), "signalfd");
  return signals;
}

int serve(settings& chosen) {
  const file_descriptor signals = take_signals();
  raise_descriptor_limit();
  if (chosen.state.empty()) {
    const auto folder = default_state_folder();
    if (!folder) throw std::runtime_error("there is no home folder to keep the device's state in: use --state");
    chosen.state = folder->string();
  }
  world_options options;
  options.state = chosen.state;
  options.kept_trace = level_of(chosen.kept_trace);
  std::shared_ptr<secure_world> world = secure_world::open(options);

  std::optional<file_descriptor> listener = passed_socket();
  std::optional<listening_socket> own;
  std::string place = "the socket that was passed";
  if (!listener) {
    place = chosen.socket.empty() ? (std::filesystem::path(chosen.state) / "teed.sock").string() : chosen.socket;
    own.emplace(place, static_cast<mode_t>(std::stoul(chosen.mode, nullptr, 8)));
    listener = own->take();
  }
  chosen.limits.allow_connections(chosen.limits.connections);
  chosen.limits.allow_memory(chosen.memory_mib << 20);

  server tee(
      {std::move(world), std::filesystem::absolute(chosen.state).string(), std::move(*listener), chosen.limits, [&own] {
         own.reset();
         (void)notify_manager("STOPPING=1");
       }});
  say(fmt::format("serving {} on {}", chosen.state, place));
  (void)notify_manager("READY=1\nSTATUS=serving " + chosen.state);
  tee.run(signals.get());
  say("ended");
  return exit_done;
}

int run(int argc, const char* const* argv) {
  CLI::App app(description, "teed");
  settings chosen;
  add_options(app, chosen);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& stop) {
    return app.exit(stop) == 0 ? exit_done : exit_usage;
  }
  try {
    return serve(chosen);
  } catch (const world_error& error) {
    say(error.what());
    return exit_no_state;
  } catch (const socket_taken& error) {
    say(error.what());
    return exit_socket_taken;
  }
}

}  // namespace
}  // namespace hosted_tee

int main(int argc, char** argv) {
  try {
    return hosted_tee::run(argc, argv);
  } catch (const std::exception& error) {
    (void)std::fprintf(stderr, "teed: %s\n", error.what());
    return hosted_tee::exit_failure;
  }
}
