#include "tee/runtime/heap_report.h"

#include <fcntl.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <system_error>

#include "tee/runtime/durable_file.h"
#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {
namespace {

void append(const std::filesystem::path& file, std::string_view lines) {
  const file_descriptor out(::open(file.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644));
  if (!out.is_open()) throw std::system_error(errno, std::generic_category(), file.string());
  write_all(out.get(), lines, file);
}

}  // namespace

heap_report::heap_report() {
  const char* file = std::getenv("KEYMASTER_HEAP_REPORT");
  if (file != nullptr) file_ = file;
}

heap_report::~heap_report() {
  if (peaks_.empty()) return;
  try {
    // One write: the lines of programs that end together do not mix.
    std::string lines;
    for (const auto& [what, bytes] : peaks_) {
      lines += to_text(from_bytes(what.first)) + " " + std::to_string(what.second) + " " + std::to_string(bytes) + "\n";
    }
    append(file_, lines);
  } catch (const std::exception& error) {
    (void)std::fprintf(stderr, "the heap report can't be written: %s\n", error.what());
  }
}

void heap_report::note(const TEE_UUID& ta, std::uint32_t command, std::uint32_t bytes) {
  if (file_.empty()) return;
  std::uint32_t& peak = peaks_[{to_bytes(ta), command}];
  peak = std::max(peak, bytes);
}

}  // namespace hosted_tee
