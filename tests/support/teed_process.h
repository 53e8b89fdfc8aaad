// The server as people run it: a process, to be ended in every way there is.
#ifndef TESTS_SUPPORT_TEED_PROCESS_H_
#define TESTS_SUPPORT_TEED_PROCESS_H_

#include <sys/types.h>

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "tee/runtime/file_descriptor.h"

namespace testing_support {

/// What a server is started on.
struct server_place {
  std::filesystem::path state;
  std::filesystem::path socket;

  [[nodiscard]] std::string context_name() const { return "unix:" + socket.string(); }
};

/// The server's exit codes, as its manual has them.
enum teed_exit : int { teed_done = 0, teed_no_state = 3, teed_socket_taken = 4 };

/// Long enough that only what hangs takes longer, on however busy a machine.
inline constexpr std::chrono::seconds ample_time{60};

/// How a process went: by itself with a code, or by a signal.
struct process_end {
  std::optional<int> code;
  int signal = 0;
  std::string said;  ///< on standard error
};

/// One run of teed. It begins at once, and nobody waits until it serves. The end of this, or of the thread that made
/// it, kills what still runs.
class teed_process {
 public:
  /// `switches` follow those for the place. Throws std::system_error.
  explicit teed_process(const server_place& place, std::vector<std::string> switches = {});
  teed_process(const teed_process&) = delete;
  teed_process& operator=(const teed_process&) = delete;
  ~teed_process();

  [[nodiscard]] pid_t pid() const { return pid_; }
  [[nodiscard]] std::string said() const;

  /// has_ended looks without waiting.
  [[nodiscard]] bool has_ended() const { return ends_within(std::chrono::milliseconds(0)); }

  /// ends_within waits for the end; false when it does not come.
  [[nodiscard]] bool ends_within(std::chrono::milliseconds limit) const;

  /// kill sends SIGKILL, terminate SIGTERM; both wait, and answer how it went. wait only waits. What has not ended
  /// within ample_time is killed, and shows as such.
  process_end kill();
  process_end terminate();
  process_end wait();

 private:
  void signal(int number) const;

  pid_t pid_ = -1;
  hosted_tee::file_descriptor said_;     // an anonymous file
  hosted_tee::file_descriptor process_;  // readable when the process has ended
  std::optional<process_end> end_;
};

}  // namespace testing_support

#endif  // TESTS_SUPPORT_TEED_PROCESS_H_
