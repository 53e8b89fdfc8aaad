// Where clients find the server.
#ifndef TEE_SERVER_LISTENER_H_
#define TEE_SERVER_LISTENER_H_

#include <sys/types.h>

#include <optional>
#include <stdexcept>
#include <string>

#include "tee/runtime/file_descriptor.h"
#include "tee/server/path_lock.h"

namespace hosted_tee {

/// Another server answers at the path.
class socket_taken : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

/// A socket file that was made here, and the right to its path: of several that want it at once, one gets it. Its end
/// removes the file, unless somebody who does not ask for the right has put another in its place.
class listening_socket {
 public:
  /// Listens at `path`, with a file of the permissions `mode` that is there whole from its first moment. A socket file
  /// that nobody answers at is replaced. Beside it are PATH.lock for as long as this lives (see path_lock), and
  /// PATH.new for a moment; a killed process leaves what is there, and the next owner replaces it. Throws socket_taken,
  /// and std::system_error when the system refuses, something else than a socket is in the way, or PATH.new is longer
  /// than the 107 bytes of a socket's address.
  listening_socket(const std::string& path, mode_t mode);
  listening_socket(const listening_socket&) = delete;
  listening_socket& operator=(const listening_socket&) = delete;
  ~listening_socket();

  /// take hands the socket to the one who accepts on it; the file stays with this owner.
  [[nodiscard]] file_descriptor take() { return std::move(socket_); }

 private:
  std::string path_;
  path_lock right_;
  file_descriptor socket_;
  dev_t device_ = 0;
  ino_t file_ = 0;
};

/// passed_socket is the listening socket that whoever started this process has opened for it, by the protocol of
/// sd_listen_fds(3): LISTEN_PID and LISTEN_FDS, which it takes out of the environment. Nothing when there is none.
/// Throws std::runtime_error when there are several, or it is not a listening Unix socket of type SOCK_SEQPACKET.
[[nodiscard]] std::optional<file_descriptor> passed_socket();

}  // namespace hosted_tee

#endif  // TEE_SERVER_LISTENER_H_
