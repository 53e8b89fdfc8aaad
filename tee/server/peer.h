// Who is on the other side of a connection, as the kernel tells it.
#ifndef TEE_SERVER_PEER_H_
#define TEE_SERVER_PEER_H_

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {

/// The facts are those of the process that connected, of the moment when it did; whoever got the socket from it speaks
/// in its name.
class peer {
 public:
  /// Throws std::system_error when the kernel does not tell.
  explicit peer(int socket);

  [[nodiscard]] uid_t user() const { return user_; }
  [[nodiscard]] pid_t process() const { return process_; }
  [[nodiscard]] bool is_member_of(gid_t group) const;

  /// may_manage tells whether the server is the peer's to look at and to end: root's, and its own user's.
  [[nodiscard]] bool may_manage() const;

  /// program is the path of the program that the process runs now. Nothing when the process has ended, when this server
  /// may not look at it, and when there is another file at the path, as this server sees it: a process in a mount
  /// namespace of its own can put any file at any path.
  [[nodiscard]] std::optional<std::string> program() const;

 private:
  uid_t user_;
  gid_t group_;
  pid_t process_;
  std::vector<gid_t> groups_;
  file_descriptor handle_;  // of the process, so that another one with its number is noticed
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_PEER_H_
