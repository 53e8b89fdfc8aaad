#include "tests/kills/kill_place.h"

#include <unistd.h>

#include <cstdlib>
#include <stdexcept>

namespace hosted_tee::testing {

kill_folder::kill_folder() {
  const std::filesystem::path memory = "/dev/shm";
  const bool has_memory = ::access(memory.c_str(), W_OK | X_OK) == 0;
  std::string name = (has_memory ? memory : std::filesystem::temp_directory_path()) / "keymaster-kills-XXXXXX";
  if (::mkdtemp(name.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
  path_ = name;
}

kill_folder::~kill_folder() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

}  // namespace hosted_tee::testing
