#include "client/kmctl/console.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>

#include "client/kmctl/output_file.h"
#include "client/lib/bytes.h"

namespace kmctl {
namespace {

struct stand_in {
  int stream;
  int access;
};

constexpr std::array stand_ins = std::to_array<stand_in>({
    {STDIN_FILENO, O_WRONLY},
    {STDOUT_FILENO, O_RDONLY},
    {STDERR_FILENO, O_WRONLY},
});

}  // namespace

void prepare_streams() noexcept {
  for (const stand_in& one : stand_ins) {
    if (::fcntl(one.stream, F_GETFD) < 0) {
      (void)::open("/dev/null", one.access);  // gets the lowest free number, which is this stream's
    }
  }
  (void)::signal(SIGXFSZ, SIG_IGN);
}

void print(std::string_view text) {
  write_file("-", keymaster::client::as_bytes(text), {});
}

void complain(std::string_view text) noexcept {
  while (!text.empty()) {
    const ssize_t written = ::write(STDERR_FILENO, text.data(), text.size());
    if (written < 0 && errno != EINTR) {
      return;
    }
    text.remove_prefix(written < 0 ? 0 : static_cast<std::size_t>(written));
  }
}

}  // namespace kmctl
