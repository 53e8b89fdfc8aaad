#include "tee/server/peer.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>

namespace hosted_tee {
namespace {

#ifndef SO_PEERPIDFD
constexpr int SO_PEERPIDFD = 77;  // Linux 6.5; younger than the headers that this may be built with
#endif

ucred credentials(int socket) {
  ucred facts{};
  socklen_t size = sizeof facts;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &facts, &size) != 0) {
    throw std::system_error(errno, std::generic_category(), "SO_PEERCRED");
  }
  return facts;
}

std::vector<gid_t> supplementary_groups(int socket) {
  std::vector<gid_t> groups(32);
  for (;;) {
    auto size = static_cast<socklen_t>(groups.size() * sizeof(gid_t));
    if (::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &size) == 0) {
      groups.resize(size / sizeof(gid_t));
      return groups;
    }
    if (errno != ERANGE || size / sizeof(gid_t) <= groups.size()) return {};
    groups.resize(size / sizeof(gid_t));
  }
}

// The kernel's own handle of the process that connected, or where it has none to give, one by the process's number.
file_descriptor process_handle(int socket, pid_t process) {
  int handle = -1;
  socklen_t size = sizeof handle;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERPIDFD, &handle, &size) == 0) return file_descriptor(handle);
  if (errno != ENOPROTOOPT || process <= 0) return {};
  return file_descriptor(static_cast<int>(::syscall(SYS_pidfd_open, process, 0)));
}

// The link leads to the file itself, wherever it is mounted.
bool is_same_file(const std::string& link, const std::string& path) {
  struct stat run {};
  struct stat named {};
  return ::stat(link.c_str(), &run) == 0 && ::stat(path.c_str(), &named) == 0 && run.st_dev == named.st_dev &&
         run.st_ino == named.st_ino;
}

bool is_running(int handle) {
  pollfd state{handle, POLLIN, 0};  // readable once the process has ended
  return ::poll(&state, 1, 0) == 0;
}

}  // namespace

peer::peer(int socket) {
  const ucred facts = credentials(socket);
  user_ = facts.uid;
  group_ = facts.gid;
  process_ = facts.pid;
  groups_ = supplementary_groups(socket);
  handle_ = process_handle(socket, process_);
}

bool peer::is_member_of(gid_t group) const {
  return group == group_ || std::find(groups_.begin(), groups_.end(), group) != groups_.end();
}

bool peer::may_manage() const {
  return user_ == 0 || user_ == ::geteuid();
}

std::optional<std::string> peer::program() const {
  if (!handle_.is_open() || process_ <= 0) return std::nullopt;
  const std::string link = "/proc/" + std::to_string(process_) + "/exe";
  std::error_code error;
  const auto path = std::filesystem::read_symlink(link, error);
  if (error || !is_same_file(link, path)) return std::nullopt;
  // As long as the process runs nobody else has its number: what was read before is its own.
  if (!is_running(handle_.get())) return std::nullopt;
  return path.string();
}

}  // namespace hosted_tee
