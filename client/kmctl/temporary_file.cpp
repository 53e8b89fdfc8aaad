#include "client/kmctl/temporary_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <system_error>
#include <utility>

namespace kmctl {
namespace {

namespace fs = std::filesystem;

/// A name as a signal handler can use it: no heap, no lock.
struct doomed_name {
  std::atomic<bool> taken = false;
  std::atomic<bool> listed = false;
  std::array<char, PATH_MAX> path{};
};

/// More than one command writes at a time. A file beyond these is not removed by a signal.
constinit std::array<doomed_name, 4> doomed{};

constexpr std::array ending_signals{SIGINT, SIGTERM, SIGHUP};

extern "C" void remove_and_end(int signal) {
  for (const doomed_name& one : doomed) {
    if (one.listed.load()) {
      (void)::unlink(one.path.data());
    }
  }
  (void)::raise(signal);  // delivered when the handler returns; its action is the default one again
}

void catch_signals() {
  for (const int signal : ending_signals) {
    struct sigaction current {};
    if (::sigaction(signal, nullptr, &current) == 0 && current.sa_handler == SIG_DFL) {
      current.sa_handler = remove_and_end;
      current.sa_flags = static_cast<int>(SA_RESETHAND);
      (void)::sigaction(signal, &current, nullptr);
    }
  }
}

std::size_t list(const std::string& path) {
  for (std::size_t i = 0; i < doomed.size(); ++i) {
    if (path.size() < PATH_MAX && !doomed[i].taken.exchange(true)) {
      std::ranges::copy(path, doomed[i].path.begin());
      doomed[i].path[path.size()] = '\0';
      doomed[i].listed = true;
      catch_signals();
      return i;
    }
  }
  return doomed.size();
}

void unlist(std::size_t slot) {
  if (slot < doomed.size()) {
    doomed[slot].listed = false;
    doomed[slot].taken = false;
  }
}

/// The name is on the disk only when the folder is. Where that can't be had the file is in its place all the same.
void flush_folder_of(const std::string& file) {
  const fs::path path(file);
  const int folder =
      ::open(path.has_parent_path() ? path.parent_path().c_str() : ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (folder >= 0) {
    (void)::fsync(folder);
    (void)::close(folder);
  }
}

[[noreturn]] void refuse(int cause) {
  throw std::system_error(cause, std::generic_category());
}

}  // namespace

temporary_file::temporary_file(std::string target) : target_(std::move(target)) {
  const fs::path path(target_);
  name_ = (path.parent_path() / ("." + path.filename().string() + ".XXXXXX")).string();
  descriptor_ = ::mkostemp(name_.data(), O_CLOEXEC);
  if (descriptor_ < 0) {
    refuse(errno);
  }
  slot_ = list(name_);
}

temporary_file::~temporary_file() {
  if (descriptor_ >= 0) {
    (void)::close(descriptor_);
  }
  if (!name_.empty()) {
    (void)::unlink(name_.c_str());
  }
  unlist(slot_);
}

void temporary_file::close() {
  if (::close(std::exchange(descriptor_, -1)) != 0) {
    refuse(errno);
  }
}

void temporary_file::put_in_place(overwrite existing) {
  close();
  const bool always = existing == overwrite::always;
  const int failed = always ? ::rename(name_.c_str(), target_.c_str())
                            : ::renameat2(AT_FDCWD, name_.c_str(), AT_FDCWD, target_.c_str(), RENAME_NOREPLACE);
  if (failed == 0) {
    name_.clear();
  } else if (always || errno == EEXIST || ::link(name_.c_str(), target_.c_str()) != 0) {
    // Some file systems lack the call that does not replace anything; a hard link doesn't either.
    refuse(errno);
  }
  flush_folder_of(target_);
}

}  // namespace kmctl
