// The server that is killed, and where it keeps what it has.
#ifndef TESTS_KILLS_KILL_PLACE_H_
#define TESTS_KILLS_KILL_PLACE_H_

#include <filesystem>

#include "tests/support/teed_process.h"

namespace hosted_tee::testing {

using testing_support::ample_time;
using testing_support::process_end;
using testing_support::server_place;
using testing_support::teed_process;
using enum testing_support::teed_exit;

/// A folder that is removed with the test, in memory where that can be had: a device writes durably, and a disk would
/// make hundreds of starts slow. What a killed process has written is there either way.
class kill_folder {
 public:
  kill_folder();
  kill_folder(const kill_folder&) = delete;
  kill_folder& operator=(const kill_folder&) = delete;
  ~kill_folder();
  [[nodiscard]] const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_KILLS_KILL_PLACE_H_
