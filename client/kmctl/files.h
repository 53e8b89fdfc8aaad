// Files in and out. "-" is standard input or output.
#ifndef KEYMASTER_CLIENT_KMCTL_FILES_H_
#define KEYMASTER_CLIENT_KMCTL_FILES_H_

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "client/lib/bytes.h"

namespace kmctl {

using keymaster::client::byte_view;
using keymaster::client::bytes;
using keymaster::client::secret_bytes;

/// A file that is read once, front to back. Not copyable.
class input_file {
 public:
  /// Opens `path`. Throws failure_error.
  explicit input_file(std::string path);
  input_file(const input_file&) = delete;
  input_file& operator=(const input_file&) = delete;
  ~input_file();

  /// read fills the buffer as far as the file goes and tells how much that was; 0 at its end. Throws failure_error.
  std::size_t read(std::span<std::uint8_t> buffer);

  /// The bytes that a regular file has; nothing for a pipe or a terminal.
  [[nodiscard]] std::optional<std::uint64_t> size() const { return size_; }

 private:
  std::string path_;
  int descriptor_;
  std::optional<std::uint64_t> size_;
};

/// Blobs, signatures and key files are small; a file above this size is not one of them.
inline constexpr std::size_t small_file_limit = std::size_t{1} << 20;

/// read_small_file reads a whole file; `what` names its content in the message when it is too large. Throws
/// failure_error. read_secret_file does the same for private keys.
[[nodiscard]] bytes read_small_file(const std::string& path, const char* what);
[[nodiscard]] secret_bytes read_secret_file(const std::string& path, const char* what);

enum class overwrite { never, always };

/// How a file is written.
struct output_rules {
  overwrite existing = overwrite::always;
  mode_t mode = 0666;  ///< before the umask
};

/// write_file writes a whole file so that at any moment, a crash included, either the old content or the new one is
/// there: through a temporary file in the same folder that is renamed when it is complete. What is not a regular file
/// (a terminal, /dev/null, a pipe) is written straight. Throws failure_error, also when the file exists and must not.
void write_file(const std::string& path, byte_view content, const output_rules& rules);

/// check_output refuses, before any work is done, an output that write_file would refuse because it exists.
void check_output(const std::string& path, const output_rules& rules);

/// same_file tells whether two names lead to the same existing file.
[[nodiscard]] bool same_file(const std::string& one, const std::string& other);

/// write_binary writes to the file `path`, or for "-" to standard output. Throws failure_error, and usage_error when
/// standard output is a terminal.
void write_binary(const std::string& path, byte_view content, const output_rules& rules);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_FILES_H_
