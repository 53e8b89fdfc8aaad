#include "tests/openssl/openssl_command.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <iterator>
#include <stdexcept>

namespace testing_support {
namespace {

/// What becomes of the descriptors and the folder of the command.
class spawn_actions {
 public:
  spawn_actions() { posix_spawn_file_actions_init(&actions_); }
  spawn_actions(const spawn_actions&) = delete;
  spawn_actions& operator=(const spawn_actions&) = delete;
  ~spawn_actions() { posix_spawn_file_actions_destroy(&actions_); }
  posix_spawn_file_actions_t* get() { return &actions_; }

 private:
  posix_spawn_file_actions_t actions_ = {};
};

std::string read_all(int descriptor) {
  std::string all;
  char part[4096];
  for (ssize_t got = 0; (got = read(descriptor, part, sizeof part)) > 0;) all.append(part, static_cast<size_t>(got));
  return all;
}

}  // namespace

openssl_result openssl(const std::filesystem::path& folder, const std::vector<std::string>& arguments) {
  std::vector<std::string> words = {OPENSSL_COMMAND};
  words.insert(words.end(), arguments.begin(), arguments.end());
  std::vector<char*> argv;
  for (std::string& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);

  int pipe_ends[2];
  if (pipe2(pipe_ends, O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  spawn_actions actions;
  posix_spawn_file_actions_addchdir_np(actions.get(), folder.c_str());
  posix_spawn_file_actions_addopen(actions.get(), STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_adddup2(actions.get(), pipe_ends[1], STDOUT_FILENO);
  posix_spawn_file_actions_addopen(actions.get(), STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  pid_t child = 0;
  const int spawned = posix_spawn(&child, OPENSSL_COMMAND, actions.get(), nullptr, argv.data(), environ);
  close(pipe_ends[1]);
  openssl_result result;
  if (spawned == 0) result.output = read_all(pipe_ends[0]);
  close(pipe_ends[0]);
  int status = 0;
  if (spawned != 0 || waitpid(child, &status, 0) != child || !WIFEXITED(status)) {
    throw std::runtime_error("openssl did not run");
  }
  result.status = WEXITSTATUS(status);
  return result;
}

void write_file(const std::filesystem::path& file, const bytes& content) {
  std::ofstream out(file, std::ios::binary);
  out.write(reinterpret_cast<const char*>(content.data()), static_cast<std::streamsize>(content.size()));
  if (!out.flush()) throw std::runtime_error("can't write " + file.string());
}

bytes read_file(const std::filesystem::path& file) {
  std::ifstream in(file, std::ios::binary);
  if (!in) throw std::runtime_error("can't read " + file.string());
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

}  // namespace testing_support
