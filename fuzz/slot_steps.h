// The steps of the other side of a channel, by the byte that chooses them. Seeds are written with the same numbers.
#ifndef FUZZ_SLOT_STEPS_H_
#define FUZZ_SLOT_STEPS_H_

#include <cstddef>
#include <cstdint>

namespace fuzzing {

enum class slot_step : std::uint8_t {
  // What the other side does.
  set_word,
  set_bytes,
  send,
  take_wake_ups,
  hang_up,
  // What the channel is asked to do.
  receive,
  receive_asleep,
  put,
};
inline constexpr std::size_t slot_step_count = 8;

/// The longest frame of the slots.
inline constexpr std::size_t longest_in_slot = 64;

}  // namespace fuzzing

#endif  // FUZZ_SLOT_STEPS_H_
