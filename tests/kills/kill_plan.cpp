#include "tests/kills/kill_plan.h"

#include <cstdlib>
#include <stdexcept>

namespace hosted_tee::testing {
namespace {

std::uint32_t number_in(const char* variable, std::uint32_t otherwise) {
  const char* const text = std::getenv(variable);
  if (text == nullptr) return otherwise;
  std::size_t used = 0;
  const unsigned long number = std::stoul(text, &used);
  if (text[used] != '\0' || number == 0 || number > UINT32_MAX) {
    throw std::invalid_argument(std::string(variable) + " is no number from 1 on");
  }
  return static_cast<std::uint32_t>(number);
}

}  // namespace

const kill_plan& kill_plan::from_environment() {
  static const kill_plan plan = {number_in("KILL_ROUNDS", 200), number_in("KILL_SEED", std::random_device()() | 1U)};
  return plan;
}

std::string kill_plan::text() const {
  return "KILL_ROUNDS=" + std::to_string(rounds) + " KILL_SEED=" + std::to_string(seed);
}

}  // namespace hosted_tee::testing
