#include "tests/load/worker.h"

#include <cstdlib>
#include <optional>

namespace load {
namespace {

std::size_t draw_step(std::mt19937& random) {
  std::array<double, most_steps> weights{};
  std::size_t count = 0;
  for (const step& each : all_steps()) weights[count++] = each.weight;
  return std::discrete_distribution<std::size_t>(weights.begin(), weights.end())(random);
}

constexpr std::size_t steps_of_a_connection = 200;  // on the average

}  // namespace

std::uint64_t tally::all_done() const {
  std::uint64_t sum = 0;
  for (const auto& each : done) sum += each;
  return sum;
}

void tally::print() const {
  for (std::size_t i = 0; i < all_steps().size(); ++i) {
    fmt::print("{:>20}: {:>8} done, {:>8} without a place\n", all_steps()[i].name, done[i].load(),
               without_place[i].load());
  }
}

void work(const std::string& tee, worker_seed seed, const key_shelf& keys, tally& counts,
          const std::function<bool()>& goes_on) {
  std::seed_seq both{seed.run, seed.worker};
  std::mt19937 random(both);
  std::optional<mixed_client> client;
  const char* doing = "connecting";
  std::optional<std::size_t> first = seed.worker % all_steps().size();  // so that a crowd leaves none out
  try {
    while (goes_on()) {
      if (!client || below(random, steps_of_a_connection) == 0) {
        doing = "connecting";
        client.reset();
        client.emplace(tee, random);
      }
      const std::size_t which = first ? *first : draw_step(random);
      doing = all_steps()[which].name;
      desk place{tee, *client, random, keys};
      const bool is_done = all_steps()[which].work(place);
      ++(is_done ? counts.done : counts.without_place)[which];
      if (is_done) first.reset();
    }
  } catch (const std::exception& wrong) {
    throw std::runtime_error(
        fmt::format("worker {} of LOAD_SEED={}, {}: {}", seed.worker, seed.run, doing, wrong.what()));
  }
}

std::uint32_t number_from_environment(const char* name, std::uint32_t fallback) {
  const char* const text = std::getenv(name);
  return text == nullptr ? fallback : static_cast<std::uint32_t>(std::stoul(text));
}

std::uint32_t seed_of_run() {
  static const std::uint32_t seed = [] {
    const std::uint32_t drawn = number_from_environment("LOAD_SEED", std::random_device{}());
    fmt::print("LOAD_SEED={}\n", drawn);
    return drawn;
  }();
  return seed;
}

}  // namespace load
