// Where a server that is killed keeps what it has.
#ifndef TESTS_KILLS_KILL_PLACE_H_
#define TESTS_KILLS_KILL_PLACE_H_

#include <filesystem>
#include <string>

namespace hosted_tee::testing {

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

/// What a server is started on.
struct server_place {
  std::filesystem::path state;
  std::filesystem::path socket;

  [[nodiscard]] std::string context_name() const { return "unix:" + socket.string(); }
};

}  // namespace hosted_tee::testing

#endif  // TESTS_KILLS_KILL_PLACE_H_
