// Small files that are there whole, old or new, whenever the process or the machine dies.
#ifndef TEE_RUNTIME_DURABLE_FILE_H_
#define TEE_RUNTIME_DURABLE_FILE_H_

#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "tee/crypto/secret_bytes.h"

namespace hosted_tee {

/// Called with the name of each step that a crash could tear.
using step_observer = std::function<void(std::string_view step)>;

/// write_durably replaces `file` (mode 0600) by `content`: a temporary file beside it, flushed to the disk, renamed
/// over it, and the folder flushed. `step` sees "<name>:begin", ":written", ":flushed", ":renamed" and ":durable".
/// Throws std::system_error: the file is the old one then and the temporary file is gone, unless the very last step,
/// the flushing of the folder, failed; then the file is the new one, and a power failure may bring back the old one.
void write_durably(const std::filesystem::path& file, std::string_view content, const step_observer& step);

/// make_folder makes `folder` (mode 0700) and what is missing above it, and flushes the folder that each is made in.
/// One that is there already is left as it is. Throws std::system_error.
void make_folder(const std::filesystem::path& folder);

/// write_all writes all of `content`; `file` names it in the std::system_error of a failure.
void write_all(int fd, std::string_view content, const std::filesystem::path& file);

/// read_file answers nothing when the file is missing; throws std::system_error for every other failure. read_secret is
/// the same for content that must not stay in memory.
[[nodiscard]] std::optional<std::string> read_file(const std::filesystem::path& file);
[[nodiscard]] std::optional<secret_bytes> read_secret(const std::filesystem::path& file);

/// remove_leftovers deletes the temporary files that a crash of write_durably left in `folder`.
void remove_leftovers(const std::filesystem::path& folder);

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_DURABLE_FILE_H_
