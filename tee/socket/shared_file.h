// Memory that two processes share: an anonymous file of fixed size, mapped by both.
#ifndef TEE_SOCKET_SHARED_FILE_H_
#define TEE_SOCKET_SHARED_FILE_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <utility>

#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {

/// Owner of a mapping.
class mapped_memory {
 public:
  mapped_memory() = default;
  mapped_memory(mapped_memory&& other) noexcept : bytes_(std::exchange(other.bytes_, {})) {}
  mapped_memory& operator=(mapped_memory&& other) noexcept {
    std::swap(bytes_, other.bytes_);
    return *this;
  }
  ~mapped_memory();

  [[nodiscard]] std::span<std::uint8_t> bytes() const { return bytes_; }

  /// empty_file takes the pages away from the file, for all who have it: then they are zeros, and cost nobody memory.
  void empty_file() const;

 private:
  friend std::optional<mapped_memory> map_file(int fd, std::size_t size);
  explicit mapped_memory(std::span<std::uint8_t> bytes) : bytes_(bytes) {}

  std::span<std::uint8_t> bytes_;
};

/// map_file maps the first `size` bytes (at least 1) for reading and writing. Nothing when the system refuses.
[[nodiscard]] std::optional<mapped_memory> map_file(int fd, std::size_t size);

/// A file and this process's view of it.
struct shared_file {
  file_descriptor file;
  mapped_memory memory;
};

/// make_shared_file makes a file of `size` zero bytes (at least 1) that nobody can make shorter or longer any more.
/// Throws std::system_error.
[[nodiscard]] shared_file make_shared_file(std::size_t size);

/// is_safe_to_share tells whether a file of somebody else's can be mapped without fear for its first `size` bytes: it
/// lies in memory, has that many bytes, and is sealed against being cut short, by which whoever touches what is gone
/// would be killed.
[[nodiscard]] bool is_safe_to_share(int fd, std::size_t size);

}  // namespace hosted_tee

#endif  // TEE_SOCKET_SHARED_FILE_H_
