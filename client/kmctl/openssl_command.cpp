#include "client/kmctl/openssl_command.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>

#include "client/kmctl/exit_codes.h"

namespace kmctl {
namespace {

/// Standard output and error of a child, both into one pipe.
class piped_output {
 public:
  piped_output() {
    if (::pipe2(ends_.data(), O_CLOEXEC) != 0) {
      throw failure_error("can't make a pipe: " + std::generic_category().message(errno));
    }
    ::posix_spawn_file_actions_init(&actions_);
    ::posix_spawn_file_actions_adddup2(&actions_, ends_[1], STDOUT_FILENO);
    ::posix_spawn_file_actions_adddup2(&actions_, ends_[1], STDERR_FILENO);
  }
  piped_output(const piped_output&) = delete;
  piped_output& operator=(const piped_output&) = delete;
  ~piped_output() {
    ::posix_spawn_file_actions_destroy(&actions_);
    close_end(0);
    close_end(1);
  }

  [[nodiscard]] const posix_spawn_file_actions_t* actions() const { return &actions_; }

  /// Everything that the child prints until it ends.
  std::string read_all() {
    close_end(1);
    std::string text;
    std::array<char, 4096> buffer{};
    for (ssize_t count = 0; (count = ::read(ends_[0], buffer.data(), buffer.size())) != 0;) {
      if (count > 0) {
        text.append(buffer.data(), static_cast<std::size_t>(count));
      } else if (errno != EINTR) {
        break;
      }
    }
    return text;
  }

 private:
  void close_end(std::size_t which) {
    if (ends_[which] >= 0) {
      (void)::close(ends_[which]);
      ends_[which] = -1;
    }
  }

  std::array<int, 2> ends_{-1, -1};
  posix_spawn_file_actions_t actions_{};
};

int wait_for(pid_t child) {
  int status = 0;
  while (::waitpid(child, &status, 0) < 0) {
    if (errno != EINTR) {
      throw failure_error("can't wait for a command: " + std::generic_category().message(errno));
    }
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

[[noreturn]] void refuse(const std::string& command, int fault) {
  throw failure_error(fmt::format("can't run {}: {}", command, std::generic_category().message(fault)),
                      fmt::format("install {}", command));
}

std::string quoted(const std::string& word) {
  constexpr std::string_view plain = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_-./:=,+@%";
  if (!word.empty() && word.find_first_not_of(plain) == std::string::npos) {
    return word;
  }
  std::string text = "'";
  for (const char c : word) {
    text += c == '\'' ? std::string("'\\''") : std::string(1, c);
  }
  return text + "'";
}

/// A file name that can't be taken for an option.
std::string as_operand(const std::string& file) {
  return file.starts_with("-") ? "./" + file : file;
}

}  // namespace

command_result run_command(const std::vector<std::string>& words) {
  std::vector<char*> arguments;
  std::vector<std::string> copies = words;  // the system's prototype wants them writable
  arguments.reserve(copies.size() + 1);
  for (std::string& word : copies) {
    arguments.push_back(word.data());
  }
  arguments.push_back(nullptr);

  piped_output pipe;
  pid_t child = 0;
  const int fault = ::posix_spawnp(&child, arguments.front(), pipe.actions(), nullptr, arguments.data(), environ);
  if (fault != 0) {
    refuse(words.front(), fault);
  }
  std::string output = pipe.read_all();
  const int status = wait_for(child);
  // POSIX: where the caller cannot be told that there is nothing to run, the child ends like this.
  if (status == 127) {
    refuse(words.front(), ENOENT);
  }
  return {.status = status, .output = std::move(output)};
}

std::string shell_words(const std::vector<std::string>& words) {
  std::string text;
  for (const std::string& word : words) {
    text += (text.empty() ? "" : " ") + quoted(word);
  }
  return text;
}

std::vector<std::string> verify_command(const std::string& public_key, const std::string& signature,
                                        const std::string& file) {
  return {"openssl", "dgst", "-sha256", "-verify", public_key, "-signature", signature, as_operand(file)};
}

std::vector<std::string> mac_command(const std::string& key, const std::string& file) {
  return {"openssl", "dgst", "-sha256", "-mac", "HMAC", "-macopt", "hexkey:" + key, as_operand(file)};
}

std::vector<std::string> oaep_command(const std::string& public_key, const std::string& secret,
                                      const std::string& ciphertext) {
  return {"openssl",  "pkeyutl",
          "-encrypt", "-pubin",
          "-inkey",   public_key,
          "-pkeyopt", "rsa_padding_mode:oaep",
          "-pkeyopt", "rsa_oaep_md:sha256",
          "-pkeyopt", "rsa_mgf1_md:sha1",
          "-in",      secret,
          "-out",     ciphertext};
}

}  // namespace kmctl
