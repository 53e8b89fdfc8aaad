// The four slots of a command on the wire.
#ifndef TEE_REMOTE_PARAMETERS_H_
#define TEE_REMOTE_PARAMETERS_H_

#include <array>
#include <cstdint>
#include <span>

#include "tee/remote/cursor.h"
#include "tee/remote/wire.h"
#include "tee_api_types.h"

namespace hosted_tee::remote {

// Slot types have the Internal Core API's numbers. These tell what a slot of a type has on the wire.
[[nodiscard]] bool is_value(std::uint32_t type);
[[nodiscard]] bool is_memory(std::uint32_t type);
[[nodiscard]] bool goes_in(std::uint32_t type);
[[nodiscard]] bool comes_out(std::uint32_t type);

/// are_slot_types tells whether all four types exist.
[[nodiscard]] bool are_slot_types(std::uint32_t types);

/// A slot of a request. Which members count depends on its type and on its source.
struct request_slot {
  std::uint32_t a = 0, b = 0;
  memory_source source = memory_source::absent;
  std::uint32_t size = 0;              ///< of the memory
  std::uint32_t block = 0;             ///< shared memory: which block, and where in it
  std::uint32_t offset = 0;            ///< shared memory: where in the block
  std::span<const std::uint8_t> data;  ///< carried memory that goes in: `size` bytes
};

struct request_slots {
  std::uint32_t types = 0;
  std::array<request_slot, 4> slots;
};

/// A slot of an answer. Of memory it has the size that the TA left, which may be more than there was room for, and the
/// bytes where the request's were to be carried.
struct answer_slot {
  std::uint32_t a = 0, b = 0;
  std::uint32_t size = 0;
  std::span<const std::uint8_t> data;
};

struct answer_slots {
  std::uint32_t types = 0;
  std::array<answer_slot, 4> slots;
};

/// The readers answer false for anything but the whole of such slots; views point into what is read.
[[nodiscard]] bool read(frame_reader& in, request_slots& out);
[[nodiscard]] bool read(frame_reader& in, answer_slots& out);
void write(frame_writer& out, const request_slots& slots);
void write(frame_writer& out, const answer_slots& slots);

/// answer_size is the room that an answer to `slots` takes at most, without what is in front of the slots.
[[nodiscard]] std::uint64_t answer_size(const request_slots& slots);

}  // namespace hosted_tee::remote

#endif  // TEE_REMOTE_PARAMETERS_H_
