// The wire between a client and the server of the hosted TEE: what both sides must agree on. docs/server.md tells it in
// words.
//
// A frame is one packet of a SOCK_SEQPACKET socket, or lies in a slot of shared memory: a header of 16 bytes and a
// body. All numbers are little-endian.
//
//   offset 0   "KTEE"
//          4   u16 version of the wire
//          6   u16 kind
//          8   u32 length of the body: what is left of the frame
//         12   u32 sequence: the client's choice, and repeated in the answer
//
// A client sends a request and waits for its answer, whose kind has answer_bit set. The first request is a hello. What
// is no request at all is answered by `refused`, which ends the connection.
#ifndef TEE_REMOTE_WIRE_H_
#define TEE_REMOTE_WIRE_H_

#include <array>
#include <cstddef>
#include <cstdint>

namespace hosted_tee::remote {

inline constexpr std::array<std::uint8_t, 4> magic = {'K', 'T', 'E', 'E'};
inline constexpr std::uint16_t wire_version = 1;
inline constexpr std::size_t header_size = 16;

/// The longest frame, in either direction. What is longer travels in shared memory.
inline constexpr std::size_t frame_limit = std::size_t{64} * 1024;

inline constexpr std::uint16_t answer_bit = 0x8000;

enum class frame_kind : std::uint16_t {
  hello = 1,
  open_session = 2,
  invoke = 3,
  close_session = 4,
  share_memory = 5,  ///< comes with one descriptor
  release_memory = 6,
  use_slots = 7,  ///< comes with one descriptor: memory for a pair of slots
  // Management: for the server's own user and for root.
  status = 16,
  log = 17,
  stop = 18,
};

/// What `refused` says. The server closes the connection behind it.
enum class refusal : std::uint32_t {
  malformed = 1,  ///< the frame is not what its kind asks for, or has no kind
  version = 2,    ///< the client speaks another version of the wire; the server's stands in the header
  crowded = 3,    ///< there are too many connections, on the whole or of this client
};
inline constexpr std::uint16_t refused_kind = answer_bit;

/// Where the bytes of a memory reference are.
enum class memory_source : std::uint32_t {
  carried = 0,  ///< in the frame: what goes in follows in the request, what comes out in the answer
  shared = 1,   ///< in a block of shared memory
  absent = 2,   ///< nowhere: a null pointer of size 0
};

inline constexpr std::uint32_t longest_text = 4096;  ///< of a text in an answer; longer ones are cut

}  // namespace hosted_tee::remote

#endif  // TEE_REMOTE_WIRE_H_
