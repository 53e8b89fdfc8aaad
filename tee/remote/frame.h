// The frame as a whole: its header, and its body as a view.
#ifndef TEE_REMOTE_FRAME_H_
#define TEE_REMOTE_FRAME_H_

#include <cstdint>
#include <span>

#include "tee/remote/cursor.h"
#include "tee/remote/wire.h"

namespace hosted_tee::remote {

struct frame_header {
  std::uint16_t version = wire_version;
  std::uint16_t kind = 0;
  std::uint32_t sequence = 0;
};

/// A frame as it arrived. The body is a view of the packet.
struct frame {
  frame_header header;
  std::span<const std::uint8_t> body;
};

/// read_frame takes a packet apart. False: it has no header of this family of wires, or its length is not the one that
/// the header tells. The version is for the caller to judge.
[[nodiscard]] bool read_frame(std::span<const std::uint8_t> packet, frame& out);

[[nodiscard]] constexpr std::uint16_t answer_to(frame_kind request) {
  return static_cast<std::uint16_t>(static_cast<std::uint16_t>(request) | answer_bit);
}

/// Puts a frame together in `room`: the header first, the body through body(), and the length at the end.
class frame_builder {
 public:
  frame_builder(std::span<std::uint8_t> room, std::uint16_t kind, std::uint32_t sequence);

  [[nodiscard]] frame_writer& body() { return writer_; }

  /// finish gives the frame; an empty one when it did not fit into the room.
  [[nodiscard]] std::span<const std::uint8_t> finish();

 private:
  std::span<std::uint8_t> room_;
  frame_writer writer_;
};

}  // namespace hosted_tee::remote

#endif  // TEE_REMOTE_FRAME_H_
