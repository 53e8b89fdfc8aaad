// The steps of a command sequence, by the byte that chooses them. Seeds are written with the same numbers.
#ifndef FUZZ_FUZZ_STEPS_H_
#define FUZZ_FUZZ_STEPS_H_

#include <cstddef>
#include <cstdint>

namespace fuzzing {

enum class step : std::uint8_t {
  capability_query,
  generate,
  import_key,
  characteristics_size,
  characteristics,
  export_key,
  delete_key,
  begin,
  begin_again,  // twice, since most that is worth finding is behind a begin and an update
  update,
  update_again,
  finish,
  abort,
  raw_command,
  service_command,
  order_fault,
};
inline constexpr std::size_t step_count = 16;

}  // namespace fuzzing

#endif  // FUZZ_FUZZ_STEPS_H_
