// Files out. "-" is standard output.
#ifndef KEYMASTER_CLIENT_KMCTL_OUTPUT_FILE_H_
#define KEYMASTER_CLIENT_KMCTL_OUTPUT_FILE_H_

#include <sys/types.h>

#include <optional>
#include <string>

#include "client/kmctl/temporary_file.h"
#include "client/lib/bytes.h"

namespace kmctl {

using keymaster::client::byte_view;

/// How a file is written.
struct output_rules {
  overwrite existing = overwrite::always;
  mode_t mode = 0666;      ///< before the umask; a file that is replaced passes its own mode on, as far as this goes
  bool hold_back = false;  ///< nothing goes out before commit, not even to standard output
};

/// A file that is written front to back and counts only when it is complete: until commit it is a temporary file in
/// the same folder, so that at any moment, a crash included, either the old content or the new one is there. Without
/// commit nothing is left. What can't be renamed (standard output, a terminal, /dev/null, a pipe) is written straight,
/// or with `hold_back` from a file without a name when commit comes. Not copyable.
class output_file {
 public:
  /// Opens the output. Throws failure_error.
  explicit output_file(std::string path, const output_rules& rules = {});
  output_file(const output_file&) = delete;
  output_file& operator=(const output_file&) = delete;
  ~output_file();

  /// write appends. Throws failure_error.
  void write(byte_view content);

  /// commit makes the file be what was written. Throws failure_error, also when the file exists and must not.
  void commit();

 private:
  void open_straight();
  void open_held();
  [[nodiscard]] mode_t final_mode() const;
  void release_held();
  [[noreturn]] void refuse(int cause) const;

  std::string path_;
  std::string target_;  ///< what the path leads to
  output_rules rules_;
  std::optional<temporary_file> temporary_;
  int straight_ = -1;  ///< what is written straight
  int held_ = -1;      ///< the file without a name
};

/// write_file writes a whole file by the rules of output_file. Throws failure_error.
void write_file(const std::string& path, byte_view content, const output_rules& rules);

/// check_output refuses, before any work is done, what write_file would refuse after it: a file that exists and must
/// not, a folder that is missing or takes no files. Throws failure_error.
void check_output(const std::string& path, const output_rules& rules);

/// check_binary_output does the same, and refuses a terminal as the place of binary output. Throws usage_error.
void check_binary_output(const std::string& path, const output_rules& rules);

/// write_binary writes to the file `path`, or for "-" to standard output. Throws failure_error, and usage_error when
/// standard output is a terminal.
void write_binary(const std::string& path, byte_view content, const output_rules& rules);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_OUTPUT_FILE_H_
