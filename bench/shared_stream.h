// An AES-GCM stream whose updates go through memory that client and TA share.
#ifndef BENCH_SHARED_STREAM_H_
#define BENCH_SHARED_STREAM_H_

#include "bench/bench_device.h"

namespace bench {

class shared_stream {
 public:
  /// Updates of `step` bytes, which are a part of `total`. What fails throws std::runtime_error.
  shared_stream(bench_device& device, std::size_t total, std::size_t step);
  shared_stream(const shared_stream&) = delete;
  shared_stream& operator=(const shared_stream&) = delete;
  ~shared_stream();

  void run();

 private:
  void update(std::uint32_t handle);

  bench_device& device_;
  std::size_t rounds_;
  bytes begin_request_, finish_request_, response_;
  TEEC_SharedMemory request_ = {};
  TEEC_SharedMemory output_ = {};
};

}  // namespace bench

#endif  // BENCH_SHARED_STREAM_H_
