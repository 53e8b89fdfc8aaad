#include "client/kmctl/files.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/system_failure.h"

namespace kmctl {
namespace {

namespace fs = std::filesystem;

[[noreturn]] void refuse(const char* doing, const std::string& path, int cause) {
  refuse_file(doing, path == "-" ? "standard input" : path, cause);
}

template <class Bytes>
Bytes read_whole(input_file& in, const char* what) {
  Bytes content(std::size_t{4096});
  std::size_t filled = 0;
  while (const std::size_t more = in.read(std::span(content).subspan(filled))) {
    filled += more;
    if (filled > small_file_limit) {
      throw failure_error(fmt::format("{} is too large for a {}", in.path(), what), "check that it is the right file");
    }
    content.resize(filled * 2 + 4096);
  }
  content.resize(filled);
  return content;
}

}  // namespace

input_file::input_file(std::string path)
    : path_(std::move(path)),
      descriptor_(path_ == "-" ? STDIN_FILENO : ::open(path_.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY)) {
  struct stat status {};
  if (descriptor_ < 0 || ::fstat(descriptor_, &status) != 0) {
    refuse("open", path_, errno);
  }
  if (S_ISREG(status.st_mode)) {
    size_ = static_cast<std::uint64_t>(status.st_size);
  }
}

input_file::~input_file() {
  if (descriptor_ != STDIN_FILENO) {
    (void)::close(descriptor_);
  }
}

std::size_t input_file::read(std::span<std::uint8_t> buffer) {
  std::size_t filled = 0;
  while (filled < buffer.size()) {
    const ssize_t count = ::read(descriptor_, buffer.data() + filled, buffer.size() - filled);
    if (count < 0 && errno != EINTR) {
      refuse("read", path_, errno);
    }
    if (count == 0) {
      break;
    }
    filled += count < 0 ? 0 : static_cast<std::size_t>(count);
  }
  return filled;
}

bool input_file::still_named() const {
  struct stat opened {};
  struct stat named {};
  return ::fstat(descriptor_, &opened) == 0 && ::stat(path_.c_str(), &named) == 0 && opened.st_dev == named.st_dev &&
         opened.st_ino == named.st_ino;
}

bytes read_small_file(const std::string& path, const char* what) {
  input_file in(path);
  return read_whole<bytes>(in, what);
}

bytes read_small_file(input_file& file, const char* what) {
  return read_whole<bytes>(file, what);
}

secret_bytes read_secret_file(const std::string& path, const char* what) {
  input_file in(path);
  return read_whole<secret_bytes>(in, what);
}

bool same_file(const std::string& one, const std::string& other) {
  std::error_code ignored;
  return one != "-" && other != "-" && fs::equivalent(one, other, ignored);
}

void refuse_overwriting(const std::string& output, const std::vector<std::string>& inputs) {
  std::error_code ignored;
  if (output == "-" || !fs::is_regular_file(output, ignored)) {
    return;  // there is nothing to lose
  }
  for (const std::string& input : inputs) {
    if (same_file(output, input == "-" ? "/dev/stdin" : input)) {
      throw usage_error(fmt::format("{} is an input of this command and would be overwritten", output),
                        "name another file for the output");
    }
  }
}

void refuse_shared_input(std::initializer_list<const std::string*> inputs) {
  std::vector<std::string> paths;
  for (const std::string* const path : inputs) {
    paths.push_back(*path);
  }
  refuse_shared_inputs(paths);
}

void refuse_shared_inputs(const std::vector<std::string>& inputs) {
  if (std::ranges::count(inputs, "-") > 1) {
    throw usage_error("only one input can come from standard input", "name a file for the others");
  }
}

}  // namespace kmctl
