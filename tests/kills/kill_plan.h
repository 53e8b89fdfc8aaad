// How often to kill, and the chances that decide when.
#ifndef TESTS_KILLS_KILL_PLAN_H_
#define TESTS_KILLS_KILL_PLAN_H_

#include <chrono>
#include <cstdint>
#include <string>
#include <thread>

#include "tests/kills/key_safe.h"

namespace hosted_tee::testing {

/// KILL_ROUNDS and KILL_SEED say it, else 200 rounds and a seed of this run.
struct kill_plan {
  unsigned rounds = 200;
  std::uint32_t seed = 0;

  [[nodiscard]] static const kill_plan& from_environment();
  [[nodiscard]] std::string text() const;  ///< "KILL_ROUNDS=200 KILL_SEED=5": how to have the same plan again
};

/// sleep_below sleeps for a random time of less than `limit`.
inline void sleep_below(dice& random, std::chrono::microseconds limit) {
  const auto moment = std::chrono::microseconds(pick(random, static_cast<std::size_t>(limit.count())));
  std::this_thread::sleep_for(moment);
}

}  // namespace hosted_tee::testing

#endif  // TESTS_KILLS_KILL_PLAN_H_
