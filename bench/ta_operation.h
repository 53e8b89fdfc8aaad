// One operation by the TA, with the sealed key handed over each time and all requests made beforehand.
#ifndef BENCH_TA_OPERATION_H_
#define BENCH_TA_OPERATION_H_

#include <vector>

#include "bench/bench_device.h"

namespace bench {

/// What an operation is to do: `message` goes in updates of `step` bytes.
struct operation_plan {
  std::uint32_t purpose = 0;
  bytes blob;
  bytes params;  // marshalled
  bytes message;
  std::size_t step = 0;  // 0: all at once
};

class ta_operation {
 public:
  ta_operation(bench_device& device, const operation_plan& plan);

  /// run does begin, the updates and finish; the answer is what finish gave.
  const bytes& run();

  /// begin starts an operation without going on, and answers its handle.
  std::uint32_t begin();

 private:
  bench_device& device_;
  std::uint32_t purpose_;
  bytes begin_request_, finish_request_, response_, output_;
  std::vector<bytes> update_requests_;
};

}  // namespace bench

#endif  // BENCH_TA_OPERATION_H_
