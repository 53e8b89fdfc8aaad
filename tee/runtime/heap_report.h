// How much heap each command of each TA takes at most, for whoever keeps a budget of it.
#ifndef TEE_RUNTIME_HEAP_REPORT_H_
#define TEE_RUNTIME_HEAP_REPORT_H_

#include <cstdint>
#include <filesystem>
#include <map>
#include <utility>

#include "tee/runtime/uuid.h"

namespace hosted_tee {

/// Collects while a secure world runs and, at its end, appends to a file: one line for each TA and command, with the
/// TA's UUID, the command's number and the most heap bytes that were in use while it ran, separated by blanks. Programs
/// may append to one file at the same time.
class heap_report {
 public:
  /// The file is the one that the environment variable KEYMASTER_HEAP_REPORT names; without it nothing is collected.
  heap_report();
  heap_report(const heap_report&) = delete;
  heap_report& operator=(const heap_report&) = delete;
  ~heap_report();  ///< what cannot be written is told on standard error

  /// note records that `bytes` were in use at most during one run of the command.
  void note(const TEE_UUID& ta, std::uint32_t command, std::uint32_t bytes);

 private:
  using key = std::pair<uuid_bytes, std::uint32_t>;

  std::filesystem::path file_;  // empty: nobody asks
  std::map<key, std::uint32_t> peaks_;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_HEAP_REPORT_H_
