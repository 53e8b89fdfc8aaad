// teed as a process, and what can be seen of it from outside.
#ifndef TESTS_LOAD_TEED_PROCESS_H_
#define TESTS_LOAD_TEED_PROCESS_H_

#include <sys/types.h>

#include <functional>
#include <string>

#include "tee/client/management.h"
#include "tests/support/device_fixture.h"

namespace load {

/// What the kernel and the server itself say that the server has.
struct holdings {
  std::size_t descriptors = 0, threads = 0, shared_maps = 0;
  std::uint32_t connections = 0, sessions = 0, instances = 0, blocks = 0;
  std::uint64_t block_bytes = 0;

  [[nodiscard]] bool is_within(const holdings& other) const;
};
void PrintTo(const holdings& what, std::ostream* out);

/// The server runs from the constructor, which waits until it answers, to the end of the scope. Functions throw
/// std::runtime_error when the server does not answer them.
class teed_process {
 public:
  teed_process();
  teed_process(const teed_process&) = delete;
  teed_process& operator=(const teed_process&) = delete;
  ~teed_process();

  [[nodiscard]] std::string name() const { return "unix:" + socket_; }

  /// One of the connections is this object's own. It is always the same, so that looking changes nothing.
  [[nodiscard]] hosted_tee::server_status status();
  [[nodiscard]] holdings holdings_now();
  /// own_memory is what the server has of its own, in bytes: without files and what it shares with clients.
  [[nodiscard]] std::size_t own_memory() const;

  /// stop has the server end, and answers its exit code.
  int stop();

 private:
  testing_support::temporary_folder folder_;
  std::string socket_;
  pid_t pid_ = 0;
  hosted_tee::server_management management_;
};

/// eventually tries again and again, for at most ten seconds, until `holds`.
bool eventually(const std::function<bool()>& holds);

}  // namespace load

#endif  // TESTS_LOAD_TEED_PROCESS_H_
