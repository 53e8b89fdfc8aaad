// From the start of a process to its end, with one P-256 signature between: a program that uses the TA, beside one that
// uses libcrypto alone.
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <stdexcept>

#include <initializer_list>

#include "bench/bench_device.h"
#include "bench/first_signature.h"
#include "bench/p256_key.h"
#include "bench/side_by_side.h"

extern char** environ;

namespace bench {
namespace {

/// The limit for the TA's program is 1.6 of the other's time.
constexpr double target_ratio = 1 / 1.6;

/// run_program runs one of the programs beside this one, with its output in a file. Throws unless it succeeds.
void run_program(const char* name, std::initializer_list<std::filesystem::path> arguments,
                 const std::filesystem::path& output) {
  const std::filesystem::path program = std::filesystem::read_symlink("/proc/self/exe").parent_path() / name;
  std::vector<std::string> words = {program.string()};
  for (const auto& argument : arguments) words.push_back(argument.string());
  std::vector<char*> argv;
  for (std::string& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);

  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, output.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
  pid_t child = 0;
  int status = -1;
  const int failed = posix_spawn(&child, program.c_str(), &actions, nullptr, argv.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  if (failed != 0 || waitpid(child, &status, 0) != child || status != 0) throw std::runtime_error(words[0] + " fails");
}

bytes content_of(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

void start_to_first_p256_signature(benchmark::State& state) {
  const temporary_folder folder;
  const std::filesystem::path parts_file = folder.path() / "parts", blob_file = folder.path() / "blob",
                              output = folder.path() / "signature", device = folder.path() / "state";
  const p256_parts parts = make_p256_parts();
  write_blocks(parts_file, {parts.point, parts.d});
  write_blocks(blob_file, {bench_device(device).import_key(p256_key_params(), p256_material(parts))});

  const auto with_ta = [&] { run_program("first_signature_ta", {device, blob_file}, output); };
  const auto with_libcrypto = [&] { run_program("first_signature_libcrypto", {parts_file}, output); };
  libcrypto_p256_signer judge(parts, first_message());
  with_ta();
  const bool ta_signs = judge.verifies(content_of(output));
  with_libcrypto();
  if (!ta_signs || !judge.verifies(content_of(output))) throw std::runtime_error("a signature doesn't verify");
  run_side_by_side(state, {.target = target_ratio}, with_ta, with_libcrypto);
  state.counters["times_as_long"] = 1 / state.counters["ratio"];
}
BENCHMARK(start_to_first_p256_signature)->UseManualTime()->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
