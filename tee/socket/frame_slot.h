// A place for one frame in memory that two processes share. A frame is handed over there without a system call.
#ifndef TEE_SOCKET_FRAME_SLOT_H_
#define TEE_SOCKET_FRAME_SLOT_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

namespace hosted_tee {

/// A word says what is in the slot: 0 for nothing; 1 for nothing, and the receiver sleeps; else the frame's length. One
/// side puts and the other takes. Word and bytes are the other side's to spoil at any time: whatever it does, a call
/// returns at once, reads and writes nothing beyond the slot, and reads each of its bytes once.
class frame_slot {
 public:
  /// `word` is 4 bytes, aligned, and `room` the place for the bytes; both in memory that stays mapped as long as the
  /// slot is used.
  frame_slot(std::uint8_t* word, std::span<std::uint8_t> room)
      : word_(static_cast<std::uint32_t*>(static_cast<void*>(word))), room_(room) {}

  enum class handed {
    over,
    to_sleeper,  ///< and the receiver must be woken
    in_vain,     ///< the frame is too long, or the word was one that no receiver leaves behind
  };
  [[nodiscard]] handed put(std::span<const std::uint8_t> frame);

  /// watch looks at the word some times, a tenth of a microsecond together, until there is something to take.
  [[nodiscard]] bool watch() const;

  /// begin_sleep tells the sender to wake the receiver. False: there is something to take instead.
  [[nodiscard]] bool begin_sleep();

  /// end_sleep takes that back. False: the sender has put something there meanwhile.
  [[nodiscard]] bool end_sleep();

  /// take copies the frame out and empties the slot. Nothing when no frame lies there, or one that is longer than the
  /// slot or than `room`.
  [[nodiscard]] std::optional<std::size_t> take(std::span<std::uint8_t> room);

 private:
  std::uint32_t* word_;
  std::span<std::uint8_t> room_;
};

}  // namespace hosted_tee

#endif  // TEE_SOCKET_FRAME_SLOT_H_
