// Two ways to the same result, measured in turns: whatever the machine does meanwhile, it does to both.
#ifndef BENCH_SIDE_BY_SIDE_H_
#define BENCH_SIDE_BY_SIDE_H_

#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <vector>

namespace bench {

/// How a ratio is meant: its target, and how often each way is gone in one iteration (more than once for ways that are
/// short beside the clock's own cost).
struct contest {
  double target = 0;
  int rounds = 1;
  const char* first = "ta_us";  // what the times of the two ways are called
  const char* second = "libcrypto_us";
};

/// time_rounds answers the seconds of one round.
template <class Way>
double time_rounds(Way& way, int rounds) {
  const auto start = std::chrono::steady_clock::now();
  for (int i = 0; i < rounds; ++i) way();
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count() / rounds;
}

inline double median(std::vector<double>& times) {
  const auto middle = times.begin() + static_cast<std::ptrdiff_t>(times.size() / 2);
  std::nth_element(times.begin(), middle, times.end());
  return *middle;
}

/// run_side_by_side runs the TA's way and libcrypto's, or two others, and reports the ratio of their rates: 1 would be
/// a TA that costs nothing. Medians, so that an interrupted round does not count.
template <class First, class Second>
void run_side_by_side(benchmark::State& state, const contest& terms, First first, Second second) {
  std::vector<double> first_times, second_times;
  bool first_begins = false;
  for ([[maybe_unused]] auto _ : state) {
    first_begins = !first_begins;
    if (first_begins) first_times.push_back(time_rounds(first, terms.rounds));
    second_times.push_back(time_rounds(second, terms.rounds));
    if (!first_begins) first_times.push_back(time_rounds(first, terms.rounds));
    state.SetIterationTime(first_times.back());
  }
  const double first_median = median(first_times), second_median = median(second_times);
  state.counters[terms.first] = first_median * 1e6;
  state.counters[terms.second] = second_median * 1e6;
  state.counters["ratio"] = second_median / first_median;
  if (terms.target != 0) state.counters["target"] = terms.target;
}

}  // namespace bench

#endif  // BENCH_SIDE_BY_SIDE_H_
