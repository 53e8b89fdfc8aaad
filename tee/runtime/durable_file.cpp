#include "tee/runtime/durable_file.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <system_error>

#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {
namespace {

constexpr std::string_view temporary_suffix = ".tee-new";

[[noreturn]] void fail(const std::filesystem::path& file) {
  throw std::system_error(errno, std::generic_category(), file.string());
}

void write_all(int fd, std::string_view content, const std::filesystem::path& file) {
  while (!content.empty()) {
    const ssize_t written = ::write(fd, content.data(), content.size());
    if (written < 0 && errno != EINTR) fail(file);
    if (written > 0) content.remove_prefix(static_cast<std::size_t>(written));
  }
}

void flush_folder(const std::filesystem::path& folder) {
  const file_descriptor fd(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!fd.is_open() || ::fsync(fd.get()) != 0) fail(folder);
}

}  // namespace

void write_durably(const std::filesystem::path& file, std::string_view content, const step_observer& step) {
  const std::string name = file.filename().string();
  const auto reached = [&](const char* what) {
    if (step) step(name + what);
  };
  const std::filesystem::path temporary = file.string() + std::string(temporary_suffix);
  reached(":begin");
  {
    const file_descriptor fd(
        ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, S_IRUSR | S_IWUSR));
    if (!fd.is_open()) fail(temporary);
    write_all(fd.get(), content, temporary);
    reached(":written");
    if (::fsync(fd.get()) != 0) fail(temporary);
  }
  reached(":flushed");
  if (::rename(temporary.c_str(), file.c_str()) != 0) fail(file);
  reached(":renamed");
  flush_folder(file.parent_path());
  reached(":durable");
}

std::optional<std::string> read_file(const std::filesystem::path& file) {
  const file_descriptor fd(::open(file.c_str(), O_RDONLY | O_CLOEXEC));
  if (!fd.is_open()) {
    if (errno == ENOENT) return std::nullopt;
    fail(file);
  }
  std::string content;
  std::array<char, 4096> chunk;
  for (;;) {
    const ssize_t got = ::read(fd.get(), chunk.data(), chunk.size());
    if (got == 0) return content;
    if (got < 0 && errno != EINTR) fail(file);
    if (got > 0) content.append(chunk.data(), static_cast<std::size_t>(got));
  }
}

void remove_leftovers(const std::filesystem::path& folder) {
  for (const auto& entry : std::filesystem::directory_iterator(folder)) {
    if (entry.path().extension() == temporary_suffix) std::filesystem::remove(entry.path());
  }
}

}  // namespace hosted_tee
