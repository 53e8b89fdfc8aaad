// Files in. "-" is standard input.
#ifndef KEYMASTER_CLIENT_KMCTL_FILES_H_
#define KEYMASTER_CLIENT_KMCTL_FILES_H_

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <span>
#include <string>
#include <vector>

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
  [[nodiscard]] const std::string& path() const { return path_; }

  /// still_named tells whether the file's name still leads to it, or another file has been put in its place.
  [[nodiscard]] bool still_named() const;

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
[[nodiscard]] bytes read_small_file(input_file& file, const char* what);
[[nodiscard]] secret_bytes read_secret_file(const std::string& path, const char* what);

/// same_file tells whether two names lead to the same existing file.
[[nodiscard]] bool same_file(const std::string& one, const std::string& other);

/// refuse_overwriting refuses an output that is one of the command's inputs under any name. Throws usage_error.
void refuse_overwriting(const std::string& output, const std::vector<std::string>& inputs);

/// refuse_shared_input and refuse_shared_inputs refuse more than one "-" among the inputs of a command. Throws
/// usage_error.
void refuse_shared_input(std::initializer_list<const std::string*> inputs);
void refuse_shared_inputs(const std::vector<std::string>& inputs);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_FILES_H_
