// One client at work: step after step, each drawn by chance.
#ifndef TESTS_LOAD_WORKER_H_
#define TESTS_LOAD_WORKER_H_

#include <array>
#include <atomic>
#include <functional>

#include "tests/load/steps.h"

namespace load {

/// How often each step came to its end, and how often it found no place for its operation. Processes can share it.
struct tally {
  std::array<std::atomic<std::uint64_t>, most_steps> done{}, without_place{};

  [[nodiscard]] std::uint64_t all_done() const;
  /// print writes a line for each step.
  void print() const;
};

/// A worker's own number and the seed of the run give all that it draws. What the others do decides when the places for
/// operations are taken, so a run comes back in kind and not to the letter.
struct worker_seed {
  std::uint32_t run, worker;
};

/// work connects to `tee` and does steps while `goes_on`; now and then it leaves and connects again. Its first step is
/// that of its number, repeated until there is a place for it. Throws std::runtime_error, which names worker, step and
/// seed, for the first answer that is wrong.
void work(const std::string& tee, worker_seed seed, const key_shelf& keys, tally& counts,
          const std::function<bool()>& goes_on);

/// number_from_environment reads a setting of the tests; `fallback` without it.
std::uint32_t number_from_environment(const char* name, std::uint32_t fallback);

/// seed_of_run is LOAD_SEED, or drawn; it is printed once.
std::uint32_t seed_of_run();

}  // namespace load

#endif  // TESTS_LOAD_WORKER_H_
