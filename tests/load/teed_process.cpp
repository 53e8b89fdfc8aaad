#include "tests/load/teed_process.h"

#include <fmt/format.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <fstream>
#include <ostream>
#include <stdexcept>
#include <thread>

namespace load {
namespace {

std::size_t count_descriptors(const std::string& proc) {
  std::size_t count = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator(proc + "/fd")) ++count;
  return count;
}

std::size_t count_shared_maps(const std::string& proc) {
  std::ifstream maps(proc + "/maps");
  std::size_t count = 0;
  for (std::string line; std::getline(maps, line);) {
    if (line.find("/memfd:") != std::string::npos) ++count;
  }
  return count;
}

/// A number of /proc/PID/status.
std::size_t status_number(const std::string& proc, const std::string& key) {
  std::ifstream status(proc + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with(key + ":")) return std::stoul(line.substr(key.size() + 1));
  }
  throw std::runtime_error("there is no " + key + " in " + proc + "/status");
}

}  // namespace

bool holdings::is_within(const holdings& other) const {
  return descriptors <= other.descriptors && threads <= other.threads && shared_maps <= other.shared_maps &&
         connections <= other.connections && sessions <= other.sessions && instances <= other.instances &&
         blocks <= other.blocks && block_bytes <= other.block_bytes;
}

void PrintTo(const holdings& what, std::ostream* out) {
  *out << fmt::format(
      "{} descriptors, {} threads, {} shared maps, {} connections, {} sessions, {} instances, {} blocks of {} bytes",
      what.descriptors, what.threads, what.shared_maps, what.connections, what.sessions, what.instances, what.blocks,
      what.block_bytes);
}

teed_process::teed_process() : socket_((folder_.path() / "tee.sock").string()) {
  const std::string state = (folder_.path() / "state").string();
  // The limit of a process is a quarter of that of all: enough for the clients of a test with their guests.
  const char* const arguments[] = {TEED_PATH,       "--state",           state.c_str(), "--socket",
                                   socket_.c_str(), "--max-connections", "1024",        nullptr};
  const int failed = ::posix_spawn(&pid_, TEED_PATH, nullptr, nullptr, const_cast<char**>(arguments), environ);
  if (failed != 0) throw std::runtime_error(fmt::format("{} can't be started: {}", TEED_PATH, failed));
  if (!eventually([this] { return management_.connect(name()).result == TEEC_SUCCESS; }))
    throw std::runtime_error("teed does not answer");
}

teed_process::~teed_process() {
  if (pid_ != 0) (void)stop();
}

hosted_tee::server_status teed_process::status() {
  hosted_tee::server_status now;
  if (management_.status(now).result != TEEC_SUCCESS) throw std::runtime_error("teed tells nothing");
  return now;
}

holdings teed_process::holdings_now() {
  const std::string proc = fmt::format("/proc/{}", pid_);
  const hosted_tee::server_status now = status();
  return {count_descriptors(proc),
          status_number(proc, "Threads"),
          count_shared_maps(proc),
          now.connections,
          now.sessions,
          static_cast<std::uint32_t>(now.tas.size()),
          now.shared_blocks,
          now.shared_bytes};
}

std::size_t teed_process::own_memory() const {
  return status_number(fmt::format("/proc/{}", pid_), "RssAnon") * 1024;
}

int teed_process::stop() {
  (void)::kill(pid_, SIGTERM);
  int ended = 0;
  while (::waitpid(pid_, &ended, 0) < 0 && errno == EINTR) {
  }
  pid_ = 0;
  return WIFEXITED(ended) ? WEXITSTATUS(ended) : 128 + WTERMSIG(ended);
}

bool eventually(const std::function<bool()>& holds) {
  using namespace std::chrono_literals;
  const auto end = std::chrono::steady_clock::now() + 10s;
  while (!holds()) {
    if (std::chrono::steady_clock::now() > end) return false;
    std::this_thread::sleep_for(5ms);
  }
  return true;
}

}  // namespace load
