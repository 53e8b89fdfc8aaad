#include "client/kmctl/ledger.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <utility>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/system_failure.h"
#include "client/kmctl/values.h"

namespace kmctl {
namespace {

namespace fs = std::filesystem;
using nlohmann::ordered_json;

/// The lock ends with its descriptor, also when the program does.
int lock_folder_of(const std::string& path) {
  const fs::path folder = fs::absolute(fs::weakly_canonical(path)).parent_path();
  const int descriptor = ::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (descriptor < 0) {
    refuse_file("open", folder.string(), errno);
  }
  while (::flock(descriptor, LOCK_EX) != 0) {
    if (errno != EINTR) {
      const int cause = errno;
      (void)::close(descriptor);
      refuse_file("lock", folder.string(), cause);
    }
  }
  return descriptor;
}

[[noreturn]] void refuse_content(const std::string& path) {
  throw failure_error(fmt::format("{} is not a ledger", path), "name another file; one that does not exist is begun");
}

}  // namespace

ledger::ledger(std::string path) : path_(std::move(path)), lock_(lock_folder_of(path_)) {
  try {
    read();
  } catch (...) {
    (void)::close(lock_);
    throw;
  }
}

ledger::~ledger() {
  (void)::close(lock_);
}

void ledger::read() {
  if (!fs::exists(path_)) {
    return;
  }
  const bytes file = read_small_file(path_, "ledger");
  const auto object = ordered_json::parse(file.begin(), file.end(), nullptr, false);
  if (!object.is_object() || !object.contains("counter") || !object["counter"].is_number_unsigned()) {
    refuse_content(path_);
  }
  counter_ = object["counter"].get<std::uint64_t>();
  if (const auto id = object.find("device_id"); id != object.end()) {
    if (!id->is_string()) {
      refuse_content(path_);
    }
    device_id_ = id->get<std::string>();
  }
}

void ledger::expect_device(byte_view id) {
  std::string expected = to_hex(id);
  if (!device_id_.empty() && device_id_ != expected) {
    throw usage_error(fmt::format("{} is the ledger of another device", path_), "each device has a ledger of its own");
  }
  device_id_ = std::move(expected);
}

void ledger::record(std::uint64_t counter) {
  ordered_json object = ordered_json::object();
  if (!device_id_.empty()) {
    object["device_id"] = device_id_;
  }
  object["counter"] = counter;
  write_file(path_, keymaster::client::as_bytes(object.dump(2) + "\n"), {});
  counter_ = counter;
}

}  // namespace kmctl
