// The right to a path, among servers that all want it.
#ifndef TEE_SERVER_PATH_LOCK_H_
#define TEE_SERVER_PATH_LOCK_H_

#include <optional>
#include <string>

#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {

/// Held by a lock (flock(2)) on the file PATH.lock, and let go by its end, which removes the file. A holder that is
/// killed leaves the file, which holds nobody up: the lock ends with the process.
class path_lock {
 public:
  /// take does not wait: it answers nothing while another has the path. Throws std::system_error when the file can't be
  /// made or opened; a link in its place is not followed.
  [[nodiscard]] static std::optional<path_lock> take(const std::string& path);

  path_lock(path_lock&&) = default;
  path_lock& operator=(path_lock&&) = delete;
  path_lock(const path_lock&) = delete;
  path_lock& operator=(const path_lock&) = delete;
  ~path_lock();

 private:
  path_lock(std::string file, file_descriptor held) : file_(std::move(file)), held_(std::move(held)) {}

  std::string file_;
  file_descriptor held_;
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_PATH_LOCK_H_
