// Signs of life on a terminal: a bar for streams, a turning mark for work of unknown length. On anything that isn't a
// terminal they print nothing.
#ifndef KEYMASTER_CLIENT_KMCTL_PROGRESS_H_
#define KEYMASTER_CLIENT_KMCTL_PROGRESS_H_

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <thread>

namespace kmctl {

/// Shows how far a stream is. Appears only when the work takes longer than a moment, and removes itself.
class progress_bar {
 public:
  /// `total` is the number of bytes to come, if that is known.
  progress_bar(std::string label, std::optional<std::uint64_t> total);
  progress_bar(const progress_bar&) = delete;
  progress_bar& operator=(const progress_bar&) = delete;
  ~progress_bar();

  /// advance adds bytes that are done.
  void advance(std::uint64_t count);

 private:
  void draw();

  std::string label_;
  std::optional<std::uint64_t> total_;
  std::uint64_t done_ = 0;
  std::chrono::steady_clock::time_point next_;
  bool drawn_ = false;
  bool terminal_;
};

/// Turns while it exists, next to `label` and the seconds that have passed.
class spinner {
 public:
  explicit spinner(std::string label);
  spinner(const spinner&) = delete;
  spinner& operator=(const spinner&) = delete;
  ~spinner();

 private:
  void turn();

  std::string label_;
  std::mutex mutex_;
  std::condition_variable ended_;
  bool end_ = false;
  std::thread thread_;
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_PROGRESS_H_
