#include "tee/server/listener.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <system_error>

#include "tee/socket/packet_socket.h"

namespace hosted_tee {
namespace {

constexpr int backlog = 256;
constexpr int first_passed = 3;

[[noreturn]] void fail(const std::string& what) {
  throw std::system_error(errno, std::generic_category(), what);
}

file_descriptor make_socket() {
  file_descriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket.is_open()) fail("socket");
  return socket;
}

path_lock right_to(const std::string& path) {
  std::optional<path_lock> right = path_lock::take(path);
  if (!right) throw socket_taken("another server answers at " + path);
  return std::move(*right);
}

// Only what is a socket, and dead, may be replaced. Who answers without the right to the path was given its socket.
void check_place(const std::string& path, const sockaddr_un& address) {
  struct stat facts {};
  if (::lstat(path.c_str(), &facts) != 0) {
    if (errno == ENOENT) return;
    fail(path);
  }
  if (!S_ISSOCK(facts.st_mode)) {
    errno = EEXIST;
    fail(path + " is not a socket");
  }
  const file_descriptor probe = make_socket();
  const int result = ::connect(probe.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
  if (result == 0 || errno == EAGAIN) throw socket_taken("another server answers at " + path);
  if (errno == EPROTOTYPE) throw socket_taken("a server of another kind answers at " + path);
  if (errno != ECONNREFUSED && errno != ENOENT) fail(path);
}

// What a process left that was killed on its way.
void remove_dead_socket(const std::string& path) {
  struct stat facts {};
  if (::lstat(path.c_str(), &facts) == 0 && S_ISSOCK(facts.st_mode)) (void)::unlink(path.c_str());
}

int number_of(const char* variable) {
  const char* const text = std::getenv(variable);
  return text == nullptr ? 0 : std::atoi(text);  // NOLINT(cert-err34-c): what is no number is 0
}

int option_of(int socket, int option) {
  int value = -1;
  socklen_t size = sizeof value;
  return ::getsockopt(socket, SOL_SOCKET, option, &value, &size) == 0 ? value : -1;
}

}  // namespace

// The file gets its permissions and its listener under another name and then its own, so that nobody finds it unready.
listening_socket::listening_socket(const std::string& path, mode_t mode)
    : path_(path), right_(right_to(path)), socket_(make_socket()) {
  check_place(path, socket_address(path));
  const std::string unready = path + ".new";
  const sockaddr_un address = socket_address(unready);
  remove_dead_socket(unready);
  if (::bind(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) fail(unready);
  struct stat facts {};
  const bool is_ready = ::chmod(unready.c_str(), mode) == 0 && ::stat(unready.c_str(), &facts) == 0 &&
                        ::listen(socket_.get(), backlog) == 0 && ::rename(unready.c_str(), path.c_str()) == 0;
  if (!is_ready) {
    const int error = errno;
    (void)::unlink(unready.c_str());
    errno = error;
    fail(path);
  }
  device_ = facts.st_dev;
  file_ = facts.st_ino;
}

listening_socket::~listening_socket() {
  struct stat facts {};
  if (::lstat(path_.c_str(), &facts) != 0 || facts.st_dev != device_ || facts.st_ino != file_) return;
  (void)::unlink(path_.c_str());
}

std::optional<file_descriptor> passed_socket() {
  const bool is_meant = number_of("LISTEN_PID") == ::getpid();
  const int count = is_meant ? number_of("LISTEN_FDS") : 0;
  for (const char* variable : {"LISTEN_PID", "LISTEN_FDS", "LISTEN_FDNAMES"}) ::unsetenv(variable);
  if (count <= 0) return std::nullopt;
  if (count > 1) throw std::runtime_error("this server listens at one socket, and was passed " + std::to_string(count));
  file_descriptor socket(first_passed);
  (void)::fcntl(first_passed, F_SETFD, FD_CLOEXEC);
  if (option_of(first_passed, SO_DOMAIN) != AF_UNIX || option_of(first_passed, SO_TYPE) != SOCK_SEQPACKET ||
      option_of(first_passed, SO_ACCEPTCONN) != 1) {
    throw std::runtime_error("the socket that was passed is not a listening Unix socket of type SOCK_SEQPACKET");
  }
  return socket;
}

}  // namespace hosted_tee
