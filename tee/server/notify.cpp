#include "tee/server/notify.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <cstddef>
#include <cstdlib>
#include <iterator>

#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {

bool notify_manager(std::string_view state) {
  const char* const variable = std::getenv("NOTIFY_SOCKET");
  if (variable == nullptr || *variable == '\0') return true;
  const std::string_view name = variable;
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if ((name.front() != '/' && name.front() != '@') || name.size() >= sizeof address.sun_path) return false;
  std::copy(name.begin(), name.end(), std::begin(address.sun_path));
  if (name.front() == '@') address.sun_path[0] = '\0';
  const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + name.size());
  const file_descriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  if (!socket.is_open()) return false;
  const ssize_t sent = ::sendto(socket.get(), state.data(), state.size(), MSG_NOSIGNAL,
                                reinterpret_cast<const sockaddr*>(&address), size);
  return sent == static_cast<ssize_t>(state.size());
}

}  // namespace hosted_tee
