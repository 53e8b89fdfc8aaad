#include "tests/load/watched_teed.h"

#include <fmt/format.h>

#include <fstream>
#include <ostream>
#include <stdexcept>

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

// The limit of a process is a quarter of that of all: enough for the clients of a test with their guests.
watched_teed::watched_teed()
    : place_{folder_.path() / "state", folder_.path() / "tee.sock"}, process_(place_, {"--max-connections", "1024"}) {
  if (!eventually([this] { return management_.connect(name()).result == TEEC_SUCCESS; }))
    throw std::runtime_error("teed does not answer: " + process_.said());
}

std::string watched_teed::proc() const {
  return fmt::format("/proc/{}", process_.pid());
}

hosted_tee::server_status watched_teed::status() {
  hosted_tee::server_status now;
  if (management_.status(now).result != TEEC_SUCCESS) throw std::runtime_error("teed tells nothing");
  return now;
}

holdings watched_teed::holdings_now() {
  const hosted_tee::server_status now = status();
  return {count_descriptors(proc()),
          status_number(proc(), "Threads"),
          count_shared_maps(proc()),
          now.connections,
          now.sessions,
          static_cast<std::uint32_t>(now.tas.size()),
          now.shared_blocks,
          now.shared_bytes};
}

std::size_t watched_teed::own_memory() const {
  return status_number(proc(), "RssAnon") * 1024;
}

}  // namespace load
