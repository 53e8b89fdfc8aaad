#include "tee/runtime/durable_file.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <iterator>
#include <system_error>
#include <utility>
#include <vector>

#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {
namespace {

constexpr std::string_view temporary_suffix = ".tee-new";

[[noreturn]] void fail(const std::filesystem::path& file) {
  throw std::system_error(errno, std::generic_category(), file.string());
}

void flush_folder(const std::filesystem::path& folder) {
  const file_descriptor fd(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!fd.is_open() || ::fsync(fd.get()) != 0) fail(folder);
}

/// A file that is removed again unless it has been put into its place.
class temporary_file {
 public:
  explicit temporary_file(std::filesystem::path path)
      : path_(std::move(path)),
        fd_(::open(path_.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, S_IRUSR | S_IWUSR)) {
    if (!fd_.is_open()) fail(path_);
  }
  ~temporary_file() {
    if (!in_place_) (void)::unlink(path_.c_str());
  }
  temporary_file(const temporary_file&) = delete;
  temporary_file& operator=(const temporary_file&) = delete;

  void write(std::string_view content) const { write_all(fd_.get(), content, path_); }
  void flush() const {
    if (::fsync(fd_.get()) != 0) fail(path_);
  }
  void rename(const std::filesystem::path& file) {
    if (::rename(path_.c_str(), file.c_str()) != 0) fail(file);
    in_place_ = true;
  }

 private:
  std::filesystem::path path_;
  file_descriptor fd_;
  bool in_place_ = false;
};

template <class Content>
std::optional<Content> read_as(const std::filesystem::path& file) {
  const file_descriptor fd(::open(file.c_str(), O_RDONLY | O_CLOEXEC));
  if (!fd.is_open()) {
    if (errno == ENOENT) return std::nullopt;
    fail(file);
  }
  Content content;
  secret_bytes chunk(4096);
  for (;;) {
    const ssize_t got = ::read(fd.get(), chunk.data(), chunk.size());
    if (got == 0) return content;
    if (got < 0 && errno != EINTR) fail(file);
    if (got > 0) content.insert(content.end(), chunk.begin(), chunk.begin() + got);
  }
}

}  // namespace

void write_all(int fd, std::string_view content, const std::filesystem::path& file) {
  while (!content.empty()) {
    const ssize_t written = ::write(fd, content.data(), content.size());
    if (written < 0 && errno != EINTR) fail(file);
    if (written > 0) content.remove_prefix(static_cast<std::size_t>(written));
  }
}

void write_durably(const std::filesystem::path& file, std::string_view content, const step_observer& step) {
  const std::string name = file.filename().string();
  const auto reached = [&](const char* what) {
    if (step) step(name + what);
  };
  reached(":begin");
  temporary_file temporary(file.string() + std::string(temporary_suffix));
  temporary.write(content);
  reached(":written");
  temporary.flush();
  reached(":flushed");
  temporary.rename(file);
  reached(":renamed");
  flush_folder(file.parent_path());
  reached(":durable");
}

// Never open to others, not even for a moment: secrets will lie in it. What is made above it is as the user's mask
// says.
void make_folder(const std::filesystem::path& folder) {
  std::vector<std::filesystem::path> missing;
  for (std::filesystem::path at = folder; !at.empty() && !std::filesystem::exists(at); at = at.parent_path()) {
    missing.push_back(at);
  }
  for (auto at = missing.rbegin(); at != missing.rend(); ++at) {
    const bool is_target = std::next(at) == missing.rend();
    const mode_t mode = is_target ? S_IRWXU : S_IRWXU | S_IRWXG | S_IRWXO;
    if (::mkdir(at->c_str(), mode) != 0) {
      if (errno == EEXIST) continue;  // another process was faster
      fail(*at);
    }
    flush_folder(at->has_parent_path() ? at->parent_path() : ".");
  }
}

std::optional<std::string> read_file(const std::filesystem::path& file) {
  return read_as<std::string>(file);
}

std::optional<secret_bytes> read_secret(const std::filesystem::path& file) {
  return read_as<secret_bytes>(file);
}

void remove_leftovers(const std::filesystem::path& folder) {
  for (const auto& entry : std::filesystem::directory_iterator(folder)) {
    if (entry.path().extension() == temporary_suffix) std::filesystem::remove(entry.path());
  }
}

}  // namespace hosted_tee
