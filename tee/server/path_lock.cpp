#include "tee/server/path_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

namespace hosted_tee {
namespace {

[[noreturn]] void fail(const std::string& file) {
  throw std::system_error(errno, std::generic_category(), file);
}

// A lock on a file that its last holder has removed in the meantime is worth nothing: others lock the new one.
bool is_still_there(const std::string& file, int held) {
  struct stat named {};
  struct stat locked {};
  return ::lstat(file.c_str(), &named) == 0 && ::fstat(held, &locked) == 0 && named.st_dev == locked.st_dev &&
         named.st_ino == locked.st_ino;
}

}  // namespace

std::optional<path_lock> path_lock::take(const std::string& path) {
  std::string file = path + ".lock";
  for (;;) {
    file_descriptor held(::open(file.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!held.is_open()) fail(file);
    if (::flock(held.get(), LOCK_EX | LOCK_NB) != 0) {
      if (errno == EWOULDBLOCK) return std::nullopt;
      fail(file);
    }
    if (is_still_there(file, held.get())) return path_lock(std::move(file), std::move(held));
  }
}

// Removed while it is locked: who has it open already finds out, and who comes later makes a new one.
path_lock::~path_lock() {
  if (held_.is_open() && is_still_there(file_, held_.get())) (void)::unlink(file_.c_str());
}

}  // namespace hosted_tee
