#include "client/kmctl/password.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <termios.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <optional>
#include <string_view>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/system_failure.h"

namespace kmctl {
namespace {

constexpr const char* terminal_name = "/dev/tty";

/// The longest line that a terminal hands over.
constexpr std::size_t line_limit = 4096;

volatile std::sig_atomic_t caught_signal = 0;

extern "C" void note_signal(int signal) {
  caught_signal = signal;
}

/// Signals that would end or stop the program while the terminal is silent are noted in place of that. They are held
/// back but for the time that wait_for_input waits: one that came just before it would otherwise be noted, and the
/// waiting would not end.
class deferred_signals {
 public:
  deferred_signals() {
    caught_signal = 0;
    struct sigaction noted {};
    noted.sa_handler = note_signal;
    sigset_t held{};
    (void)::sigemptyset(&held);
    for (const int signal : signals) {
      (void)::sigaddset(&held, signal);
    }
    (void)::pthread_sigmask(SIG_BLOCK, &held, &mask_before_);
    for (std::size_t i = 0; i < signals.size(); ++i) {
      (void)::sigaction(signals[i], nullptr, &before_[i]);
      if (before_[i].sa_handler != SIG_IGN) {
        (void)::sigaction(signals[i], &noted, nullptr);
      }
    }
  }
  deferred_signals(const deferred_signals&) = delete;
  deferred_signals& operator=(const deferred_signals&) = delete;
  ~deferred_signals() {
    (void)::pthread_sigmask(SIG_SETMASK, &mask_before_, nullptr);  // what was held back is noted now
    for (std::size_t i = 0; i < signals.size(); ++i) {
      (void)::sigaction(signals[i], &before_[i], nullptr);
    }
    if (caught_signal != 0) {
      (void)::raise(caught_signal);
    }
  }

  /// wait_for_input waits until there is something to read. False: a signal ended the waiting.
  [[nodiscard]] bool wait_for_input(int descriptor) const {
    pollfd input{.fd = descriptor, .events = POLLIN, .revents = 0};
    return ::ppoll(&input, 1, nullptr, &mask_before_) > 0;
  }

 private:
  static constexpr std::array signals{SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGTSTP};
  std::array<struct sigaction, signals.size()> before_{};
  sigset_t mask_before_{};
};

/// The controlling terminal.
class terminal {
 public:
  terminal() : descriptor_(::open(terminal_name, O_RDWR | O_CLOEXEC | O_NOCTTY)) {
    if (descriptor_ < 0 || ::tcgetattr(descriptor_, &before_) != 0) {
      close();
      throw usage_error("there is no terminal to ask for the password on", "name a file with --password-file");
    }
  }
  terminal(const terminal&) = delete;
  terminal& operator=(const terminal&) = delete;
  ~terminal() {
    (void)::tcsetattr(descriptor_, TCSAFLUSH, &before_);
    close();
  }

  void silence() {
    termios silent = before_;
    silent.c_lflag &= ~static_cast<tcflag_t>(ECHO);
    silent.c_lflag |= static_cast<tcflag_t>(ECHONL | ICANON | ISIG);
    if (::tcsetattr(descriptor_, TCSAFLUSH, &silent) != 0) {
      refuse_file("silence", terminal_name, errno);
    }
  }

  void write(std::string_view text) {
    while (!text.empty()) {
      const ssize_t count = ::write(descriptor_, text.data(), text.size());
      if (count < 0) {
        refuse_file("write", terminal_name, errno);
      }
      text.remove_prefix(static_cast<std::size_t>(count));
    }
  }

  secret_bytes read_line(const deferred_signals& signals) {
    if (!signals.wait_for_input(descriptor_)) {
      return {};
    }
    secret_bytes line(line_limit);
    const ssize_t count = ::read(descriptor_, line.data(), line.size());
    if (count < 0) {
      refuse_file("read", terminal_name, errno);
    }
    line.resize(static_cast<std::size_t>(count));
    return line;
  }

 private:
  void close() {
    if (descriptor_ >= 0) {
      (void)::close(descriptor_);
    }
  }

  int descriptor_;
  termios before_{};
};

void drop_line_ends(secret_bytes& text) {
  while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) {
    text.pop_back();
  }
}

}  // namespace

secret_bytes read_password_file(const std::string& path) {
  secret_bytes password = read_secret_file(path, "password");
  drop_line_ends(password);
  if (password.empty()) {
    throw failure_error(fmt::format("{} holds no password", path == "-" ? "standard input" : path),
                        "write the password into it");
  }
  return password;
}

secret_bytes ask_password(const std::string& prompt) {
  const deferred_signals quietly;  // outlives the terminal's silence
  terminal asked;
  asked.silence();
  asked.write(prompt);
  secret_bytes password = asked.read_line(quietly);
  drop_line_ends(password);
  if (password.empty()) {
    throw failure_error("no password was given", "type it, or name a file with --password-file");
  }
  return password;
}

option password_option::add_to(command_line& command, const std::string& flag, const std::string& help) {
  return command.add_option(flag, file_, help).type_name("FILE");
}

secret_bytes password_option::read(const std::string& prompt) const {
  return file_.empty() ? ask_password(prompt) : read_password_file(file_);
}

secret_bytes password_option::read_new(const std::string& prompt) const {
  secret_bytes password = read(prompt);
  if (file_.empty() && ask_password("The same again: ") != password) {
    throw failure_error("the two passwords differ", "try again");
  }
  return password;
}

}  // namespace kmctl
