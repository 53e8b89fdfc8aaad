#include "client/kmctl/output_file.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <system_error>
#include <utility>
#include <vector>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/system_failure.h"

namespace kmctl {
namespace {

namespace fs = std::filesystem;

[[noreturn]] void refuse_existing(const std::string& path) {
  throw failure_error(fmt::format("{} exists already", path), "choose another name, or overwrite it with --force");
}

mode_t current_umask() {
  const mode_t mask = ::umask(0);
  ::umask(mask);
  return mask;
}

class owned_descriptor {
 public:
  explicit owned_descriptor(int number) : number_(number) {}
  owned_descriptor(const owned_descriptor&) = delete;
  owned_descriptor& operator=(const owned_descriptor&) = delete;
  ~owned_descriptor() { (void)::close(number_); }
  [[nodiscard]] int get() const { return number_; }

 private:
  int number_;
};

/// A link stays a link, and what it leads to is written, be it there or not. Throws std::system_error.
std::string follow_links(const std::string& path) {
  constexpr int most_links = 40;  // as many as the kernel follows
  std::error_code ignored;
  fs::path target = path;
  for (int links = 0; fs::is_symlink(target, ignored); ++links) {
    if (links == most_links) {
      throw std::system_error(ELOOP, std::generic_category());
    }
    target = target.parent_path() / fs::read_symlink(target);
  }
  return target.string();
}

std::string follow_links_or_refuse(const std::string& path) {
  try {
    return follow_links(path);
  } catch (const std::system_error& fault) {
    refuse_file("write", path, fault.code().value());
  }
}

bool is_special(const fs::file_status& status) {
  return fs::exists(status) && !fs::is_regular_file(status);
}

}  // namespace

output_file::output_file(std::string path, const output_rules& rules) : path_(std::move(path)), rules_(rules) {
  std::error_code ignored;
  if (path_ == "-" || is_special(fs::status(path_, ignored))) {
    open_straight();
    return;
  }
  target_ = follow_links_or_refuse(path_);
  try {
    temporary_.emplace(target_);
  } catch (const std::system_error& fault) {
    refuse(fault.code().value());
  }
}

output_file::~output_file() {
  for (const int descriptor : {straight_, held_}) {
    if (descriptor >= 0 && descriptor != STDOUT_FILENO) {
      (void)::close(descriptor);
    }
  }
}

void output_file::refuse(int cause) const {
  refuse_file("write", path_ == "-" ? "standard output" : path_, cause);
}

void output_file::open_straight() {
  straight_ = path_ == "-" ? STDOUT_FILENO : ::open(path_.c_str(), O_WRONLY | O_CLOEXEC | O_NOCTTY);
  if (straight_ < 0) {
    refuse(errno);
  }
  if (rules_.hold_back) {
    open_held();
  }
}

void output_file::open_held() {
  std::string name = (fs::temp_directory_path() / "kmctl-XXXXXX").string();
  held_ = ::mkostemp(name.data(), O_CLOEXEC);
  if (held_ < 0 || ::unlink(name.c_str()) != 0) {
    refuse(errno);
  }
}

void output_file::write(byte_view content) {
  const int out = temporary_ ? temporary_->descriptor() : (held_ >= 0 ? held_ : straight_);
  while (!content.empty()) {
    const ssize_t written = ::write(out, content.data(), content.size());
    if (written < 0 && errno != EINTR) {
      refuse(errno);
    }
    content = content.subspan(written < 0 ? 0 : static_cast<std::size_t>(written));
  }
}

void output_file::release_held() {
  const owned_descriptor held(std::exchange(held_, -1));  // from here on, write goes straight
  std::vector<std::uint8_t> buffer(std::size_t{64} * 1024);
  for (off_t offset = 0;;) {
    const ssize_t count = ::pread(held.get(), buffer.data(), buffer.size(), offset);
    if (count < 0) {
      refuse(errno);
    }
    if (count == 0) {
      return;
    }
    write(byte_view(buffer).first(static_cast<std::size_t>(count)));
    offset += count;
  }
}

mode_t output_file::final_mode() const {
  struct stat replaced {};
  if (::stat(target_.c_str(), &replaced) == 0) {
    return replaced.st_mode & rules_.mode;  // what its owner keeps from others stays so
  }
  return rules_.mode & ~current_umask();
}

void output_file::commit() {
  if (held_ >= 0) {
    release_held();
  }
  if (!temporary_) {
    return;
  }
  const int out = temporary_->descriptor();
  if (::fchmod(out, final_mode()) != 0 || ::fsync(out) != 0) {
    refuse(errno);
  }
  try {
    temporary_->put_in_place(rules_.existing);
  } catch (const std::system_error& fault) {
    if (fault.code().value() == EEXIST) {
      refuse_existing(path_);
    }
    refuse(fault.code().value());
  }
}

void write_file(const std::string& path, byte_view content, const output_rules& rules) {
  output_file out(path, rules);
  out.write(content);
  out.commit();
}

void check_output(const std::string& path, const output_rules& rules) {
  if (path == "-") {
    return;
  }
  const fs::path target = follow_links_or_refuse(path);
  std::error_code ignored;
  const fs::file_status status = fs::status(target, ignored);
  if (rules.existing == overwrite::never && fs::is_regular_file(status)) {
    refuse_existing(path);
  }
  if (fs::is_directory(status)) {
    refuse_file("write", path, EISDIR);
  }
  const fs::path folder = (target.has_parent_path() ? target.parent_path() : ".") / ".";
  const int failed = is_special(status) ? ::faccessat(AT_FDCWD, target.c_str(), W_OK, AT_EACCESS)
                                        : ::faccessat(AT_FDCWD, folder.c_str(), W_OK | X_OK, AT_EACCESS);
  if (failed != 0) {
    refuse_file("write", path, errno);
  }
}

void check_binary_output(const std::string& path, const output_rules& rules) {
  check_output(path, rules);
  if (path == "-" && ::isatty(STDOUT_FILENO) == 1) {
    throw usage_error("binary output does not go to a terminal", "name a file with -o, or redirect the output");
  }
}

void write_binary(const std::string& path, byte_view content, const output_rules& rules) {
  check_binary_output(path, rules);
  write_file(path, content, rules);
}

}  // namespace kmctl
