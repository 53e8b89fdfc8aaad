// Closing descriptors behind which a client may have put others: of sockets that take their time over it.
#ifndef TEE_SERVER_CLOSING_H_
#define TEE_SERVER_CLOSING_H_

#include <condition_variable>
#include <mutex>
#include <thread>
#include <vector>

#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {

/// Who closes the last descriptor of a network socket waits as long as its owner once said (SO_LINGER), also when it
/// lies unread in a Unix socket, or in one that lies there. Only a signal ends that. nudge sends the thread one, of
/// which it sees nothing else than that system calls of it may end with EINTR. prepare_nudges must have been called
/// before; it throws std::system_error.
void prepare_nudges();
void nudge(std::thread& thread);

/// A thread that closes what its owner must not wait for.
class closer {
 public:
  /// Throws std::system_error.
  closer();
  closer(const closer&) = delete;
  closer& operator=(const closer&) = delete;
  /// All is closed when it ends.
  ~closer();

  /// take_over has the descriptor closed soon. It waits where too many others are before it, but for none in vain:
  /// closings that take their time are cut short then.
  void take_over(file_descriptor descriptor);

  /// hurry cuts short what others wait behind. False: nobody waits.
  bool hurry();

 private:
  void work();

  static constexpr std::size_t most_waiting = 8;

  std::mutex mutex_;  // guards what follows
  std::vector<file_descriptor> waiting_;
  bool is_ending_ = false;
  bool has_ended_ = false;
  std::condition_variable has_come_, has_gone_;
  std::thread thread_;
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_CLOSING_H_
