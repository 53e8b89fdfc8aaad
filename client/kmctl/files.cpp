#include "client/kmctl/files.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <system_error>
#include <utility>

#include "client/kmctl/exit_codes.h"

namespace kmctl {
namespace {

namespace fs = std::filesystem;

[[noreturn]] void refuse(const std::string& doing, const std::string& path, int cause) {
  throw failure_error(fmt::format("can't {} {}: {}", doing, path == "-" ? "standard input" : path,
                                  std::generic_category().message(cause)));
}

[[noreturn]] void refuse_existing(const std::string& path) {
  throw failure_error(fmt::format("{} exists already", path), "choose another name, or overwrite it with --force");
}

class descriptor {
 public:
  explicit descriptor(int number) : number_(number) {}
  descriptor(const descriptor&) = delete;
  descriptor& operator=(const descriptor&) = delete;
  ~descriptor() { reset(); }
  [[nodiscard]] int get() const { return number_; }
  int reset() { return number_ < 0 ? 0 : ::close(std::exchange(number_, -1)); }

 private:
  int number_;
};

/// A file that vanishes unless it is released.
class temporary_name {
 public:
  explicit temporary_name(std::string path) : path_(std::move(path)) {}
  temporary_name(const temporary_name&) = delete;
  temporary_name& operator=(const temporary_name&) = delete;
  ~temporary_name() {
    if (!path_.empty()) {
      (void)::unlink(path_.c_str());
    }
  }
  [[nodiscard]] char* data() { return path_.data(); }
  [[nodiscard]] const char* c_str() const { return path_.c_str(); }
  void release() { path_.clear(); }

 private:
  std::string path_;
};

void write_all(int out, byte_view content, const std::string& path) {
  while (!content.empty()) {
    const ssize_t written = ::write(out, content.data(), content.size());
    if (written < 0 && errno != EINTR) {
      refuse("write", path, errno);
    }
    content = content.subspan(written < 0 ? 0 : static_cast<std::size_t>(written));
  }
}

void write_straight(const std::string& path, byte_view content) {
  descriptor out(::open(path.c_str(), O_WRONLY | O_CLOEXEC | O_NOCTTY));
  if (out.get() < 0) {
    refuse("open", path, errno);
  }
  write_all(out.get(), content, path);
}

mode_t current_umask() {
  const mode_t mask = ::umask(0);
  ::umask(mask);
  return mask;
}

/// Puts the complete file in its place. The kernel decides about an existing one, so that two writers can't both win.
void put_in_place(temporary_name& temporary, const std::string& target, overwrite existing) {
  if (existing == overwrite::always) {
    if (::rename(temporary.c_str(), target.c_str()) != 0) {
      refuse("write", target, errno);
    }
    temporary.release();
    return;
  }
  if (::renameat2(AT_FDCWD, temporary.c_str(), AT_FDCWD, target.c_str(), RENAME_NOREPLACE) == 0) {
    temporary.release();
    return;
  }
  // Some file systems lack that call; a hard link does not replace anything either.
  if (errno == EEXIST || ::link(temporary.c_str(), target.c_str()) != 0) {
    if (errno == EEXIST) {
      refuse_existing(target);
    }
    refuse("write", target, errno);
  }
}

template <class Bytes>
Bytes read_whole(const std::string& path, const char* what) {
  input_file in(path);
  Bytes content(std::size_t{4096});
  std::size_t filled = 0;
  while (const std::size_t more = in.read(std::span(content).subspan(filled))) {
    filled += more;
    if (filled > small_file_limit) {
      throw failure_error(fmt::format("{} is too large for a {}", path, what));
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

bytes read_small_file(const std::string& path, const char* what) {
  return read_whole<bytes>(path, what);
}

secret_bytes read_secret_file(const std::string& path, const char* what) {
  return read_whole<secret_bytes>(path, what);
}

bool same_file(const std::string& one, const std::string& other) {
  std::error_code ignored;
  return one != "-" && other != "-" && fs::equivalent(one, other, ignored);
}

void check_output(const std::string& path, const output_rules& rules) {
  std::error_code ignored;
  if (path != "-" && rules.existing == overwrite::never && fs::is_regular_file(fs::status(path, ignored))) {
    refuse_existing(path);
  }
}

void write_file(const std::string& path, byte_view content, const output_rules& rules) {
  std::error_code ignored;
  const fs::file_status status = fs::status(path, ignored);
  if (fs::exists(status) && !fs::is_regular_file(status)) {
    write_straight(path, content);
    return;
  }
  // A link stays a link: what it leads to is replaced.
  const std::string target = fs::is_regular_file(status) ? fs::canonical(path).string() : path;
  const fs::path folder = fs::path(target).parent_path();
  temporary_name temporary((folder / ("." + fs::path(target).filename().string() + ".XXXXXX")).string());
  descriptor out(::mkostemp(temporary.data(), O_CLOEXEC));
  if (out.get() < 0) {
    temporary.release();
    refuse("write", path, errno);
  }
  write_all(out.get(), content, path);
  if (::fchmod(out.get(), rules.mode & ~current_umask()) != 0 || ::fsync(out.get()) != 0 || out.reset() != 0) {
    refuse("write", path, errno);
  }
  put_in_place(temporary, target, rules.existing);
}

void write_binary(const std::string& path, byte_view content, const output_rules& rules) {
  if (path != "-") {
    write_file(path, content, rules);
    return;
  }
  if (::isatty(STDOUT_FILENO) == 1) {
    throw usage_error("binary output does not go to a terminal", "name a file with -o, or redirect the output");
  }
  write_all(STDOUT_FILENO, content, "standard output");
}

}  // namespace kmctl
