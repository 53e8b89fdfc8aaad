// A server of the hosted TEE beside the benchmark, on a device of its own.
#ifndef BENCH_TEED_PROCESS_H_
#define BENCH_TEED_PROCESS_H_

#include <sys/types.h>

#include <string>

#include "bench/bench_device.h"

namespace bench {

/// Starts teed, and ends it with its owner. What fails throws std::runtime_error.
class teed_process {
 public:
  teed_process();
  teed_process(const teed_process&) = delete;
  teed_process& operator=(const teed_process&) = delete;
  ~teed_process();

  /// The name of a context on it.
  [[nodiscard]] std::string context_name() const { return "unix:" + socket_; }

 private:
  temporary_folder folder_;
  std::string socket_;
  pid_t process_ = -1;
};

}  // namespace bench

#endif  // BENCH_TEED_PROCESS_H_
