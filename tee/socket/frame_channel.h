// One side of a connection: a socket for frames, and a pair of slots beside it that saves its system calls.
#ifndef TEE_SOCKET_FRAME_CHANNEL_H_
#define TEE_SOCKET_FRAME_CHANNEL_H_

#include <chrono>
#include <cstdint>
#include <optional>
#include <span>

#include "tee/socket/frame_slot.h"
#include "tee/socket/packet_socket.h"
#include "tee/socket/patience.h"
#include "tee/socket/shared_file.h"

namespace hosted_tee {

/// The memory of a pair of slots: two words, each in cache lines of its own, and the bytes from the second page on.
struct slot_layout {
  static constexpr std::size_t request_word = 0, answer_word = 128, first_room = 4096;
  std::size_t longest;  ///< of a frame

  [[nodiscard]] constexpr std::size_t size() const { return first_room + 2 * longest; }
};

/// Frames go through a slot while both sides are awake, and nobody but the two is asked. Who sleeps does so at the
/// socket, and has said so in its slot: then a packet of one zero byte follows the frame. So the end of the other side
/// is seen at the socket, whatever is in the slots. One thread at a time uses a channel.
class frame_channel {
 public:
  explicit frame_channel(file_descriptor socket) : socket_(std::move(socket)) {}

  [[nodiscard]] int socket() const { return socket_.get(); }
  [[nodiscard]] bool is_open() const { return socket_.is_open(); }
  [[nodiscard]] file_descriptor take_socket() { return std::move(socket_); }
  void close() { socket_ = file_descriptor(); }

  /// Slots are of use where there is a processor to watch them with.
  [[nodiscard]] static bool wants_slots() { return patience::is_possible(); }

  enum class side { asks, answers };

  /// use_slots takes the memory, of a layout's size, that both sides have mapped. From then on the side that asks
  /// watches for as long as usual commands take.
  void use_slots(mapped_memory memory, slot_layout layout, side mine);
  [[nodiscard]] bool has_slots() const { return memory_.has_value(); }

  /// empty_slots takes the pages away from the slots' file, when the other side has gone: see mapped_memory.
  void empty_slots();

  /// receive waits for the next frame, from wherever it comes. What is in a slot and is none is unfit, and so is a
  /// wake-up without a frame for who sleeps; who is awake gets it as the packet that it is, which is no frame.
  [[nodiscard]] received receive(std::span<std::uint8_t> room);

  /// send is send_packet. put hands the frame over in the slot, and answers EPROTO when the other side has spoilt that.
  [[nodiscard]] int send(std::span<const std::uint8_t> frame, int passed = -1) const {
    return send_packet(socket_.get(), frame, passed);
  }
  [[nodiscard]] int put(std::span<const std::uint8_t> frame);

 private:
  struct slots {
    mapped_memory memory;
    frame_slot incoming, outgoing;
  };

  [[nodiscard]] received take(std::span<std::uint8_t> room);
  [[nodiscard]] received receive_sleeping(std::span<std::uint8_t> room);

  file_descriptor socket_;
  std::optional<slots> memory_;
  patience waiting_{std::chrono::microseconds(50)};  // as long as a client rests between two commands
};

}  // namespace hosted_tee

#endif  // TEE_SOCKET_FRAME_CHANNEL_H_
