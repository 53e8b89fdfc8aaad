#include "tests/support/teed_process.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <string_view>
#include <system_error>

namespace testing_support {
namespace {

[[noreturn]] void fail(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

bool is_kept(std::string_view variable) {
  if (variable.starts_with("KEYMASTER_TA_PATH=")) return true;
  constexpr std::array<std::string_view, 5> others = {"KEYMASTER_", "NOTIFY_SOCKET=", "LISTEN_",
                                                      "ASAN_OPTIONS=", "UBSAN_OPTIONS="};
  return std::none_of(others.begin(), others.end(), [&](auto prefix) { return variable.starts_with(prefix); });
}

// What this process was told does not reach the server, and a sanitizer's finding does not pass for an exit code.
std::vector<std::string> environment() {
  std::vector<std::string> variables;
  for (char** variable = environ; *variable != nullptr; ++variable) {
    if (is_kept(*variable)) variables.emplace_back(*variable);
  }
  variables.emplace_back("ASAN_OPTIONS=exitcode=99");
  variables.emplace_back("UBSAN_OPTIONS=exitcode=99");
  return variables;
}

std::vector<char*> pointers(std::vector<std::string>& texts) {
  std::vector<char*> all;
  all.reserve(texts.size() + 1);
  for (std::string& text : texts) all.push_back(text.data());
  all.push_back(nullptr);
  return all;
}

}  // namespace

teed_process::teed_process(const server_place& place, std::vector<std::string> switches)
    : said_(::memfd_create("said", MFD_CLOEXEC)) {
  if (!said_.is_open()) fail("memfd_create");
  std::vector<std::string> words = {TEED_PATH, "--state", place.state, "--socket", place.socket};
  words.insert(words.end(), switches.begin(), switches.end());
  std::vector<std::string> variables = environment();
  const std::vector<char*> arguments = pointers(words), settings = pointers(variables);
  pid_ = ::fork();
  if (pid_ < 0) fail("fork");
  if (pid_ == 0) {
    // Nothing here but what is safe beside the other threads that this process had.
    (void)::prctl(PR_SET_PDEATHSIG, SIGKILL);
    (void)::dup2(said_.get(), STDERR_FILENO);
    ::execve(TEED_PATH, arguments.data(), settings.data());
    ::_exit(127);
  }
  process_ = hosted_tee::file_descriptor(static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0)));
  if (!process_.is_open()) fail("pidfd_open");
}

teed_process::~teed_process() {
  if (pid_ <= 0 || end_) return;
  signal(SIGKILL);
  (void)::waitpid(pid_, nullptr, 0);
}

std::string teed_process::said() const {
  std::string text(static_cast<std::size_t>(std::max<off_t>(::lseek(said_.get(), 0, SEEK_END), 0)), '\0');
  const ssize_t size = ::pread(said_.get(), text.data(), text.size(), 0);
  text.resize(static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
  return text;
}

bool teed_process::ends_within(std::chrono::milliseconds limit) const {
  pollfd watched{process_.get(), POLLIN, 0};
  return end_ || ::poll(&watched, 1, static_cast<int>(limit.count())) == 1;
}

void teed_process::signal(int number) const {
  if (!end_) (void)::kill(pid_, number);
}

process_end teed_process::wait() {
  if (end_) return *end_;
  if (!ends_within(ample_time)) signal(SIGKILL);
  int state = 0;
  if (::waitpid(pid_, &state, 0) != pid_) fail("waitpid");
  end_.emplace();
  if (WIFEXITED(state)) end_->code = WEXITSTATUS(state);
  if (WIFSIGNALED(state)) end_->signal = WTERMSIG(state);
  end_->said = said();
  return *end_;
}

process_end teed_process::kill() {
  signal(SIGKILL);
  return wait();
}

process_end teed_process::terminate() {
  signal(SIGTERM);
  return wait();
}

}  // namespace testing_support
