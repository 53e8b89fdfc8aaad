// The steps of a soter sequence, by the byte that chooses them. Seeds are written with the same numbers.
#ifndef FUZZ_SOTER_STEPS_H_
#define FUZZ_SOTER_STEPS_H_

#include <cstddef>
#include <cstdint>

namespace fuzzing {

enum class soter_step : std::uint8_t {
  service,
  notify,
  change_key,
  change_property,
  change_opening,
  export_key,
  begin,
  update,
  finish,
  advance_clock,
  order_fault,
  restart,
  store_counter,
};
inline constexpr std::size_t soter_step_count = 13;

/// The keys that the sequences use, by the byte that chooses them.
enum class soter_key : std::uint8_t { counted_by_attk, by_attk, counted_by_key, by_named_key, by_nobody };
inline constexpr std::size_t soter_key_count = 5;

}  // namespace fuzzing

#endif  // FUZZ_SOTER_STEPS_H_
