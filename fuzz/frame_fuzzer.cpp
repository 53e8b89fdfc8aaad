// The wire of the server: any packet is a frame of one meaning or none. What is read writes back to the same bytes, and
// a command that is read reaches for no byte that its client did not share.
#include <algorithm>

#include "fuzz/frame_kinds.h"
#include "fuzz/fuzz_device.h"
#include "tee/remote/frame.h"
#include "tee/remote/messages.h"
#include "tee/server/call_memory.h"

using namespace hosted_tee;

namespace fuzzing {
namespace {

constexpr std::uint32_t block_size = 4096;

/// Two blocks of shared memory, as a client may have them: one for both directions and one that only goes in.
class shared_blocks {
 public:
  shared_blocks() : blocks_(limits_, account_) {
    for (const std::uint32_t flags : {TEEC_MEM_INPUT | TEEC_MEM_OUTPUT, TEEC_MEM_INPUT}) {
      const shared_file file = make_shared_file(block_size);
      std::uint32_t number = 0;
      require(blocks_.add(file.file.get(), block_size, flags, number) == TEEC_SUCCESS, "memory can be shared");
    }
  }
  [[nodiscard]] const block_collection& get() const { return blocks_; }

 private:
  server_limits limits_;
  memory_account account_;
  block_collection blocks_;
};

/// What a TA may do with a slot's memory: all of it, as far as it goes.
void touch(const TEE_Param& param, std::uint32_t type) {
  auto* const memory = static_cast<std::uint8_t*>(param.memref.buffer);
  std::uint8_t sum = 0;
  for (std::uint32_t i = 0; i < param.memref.size; ++i) {
    sum = static_cast<std::uint8_t>(sum + memory[i]);
    if (remote::comes_out(type)) memory[i] = sum;
  }
}

void play_command(const remote::request_slots& slots, std::uint8_t choice) {
  static const shared_blocks shared;
  bytes scratch(remote::frame_limit);
  call_memory memory(scratch);
  if (memory.take(slots, shared.get()) != TEEC_SUCCESS) return;
  for (std::size_t i = 0; i < 4; ++i) {
    const std::uint32_t type = TEE_PARAM_TYPE_GET(slots.types, i);
    TEE_Param& param = memory.params()[i];
    if (!remote::is_memory(type)) continue;
    touch(param, type);
    if (remote::comes_out(type)) param.memref.size = choice % 2 == 0 ? param.memref.size / 2 : param.memref.size * 2;
  }
  bytes room(remote::frame_limit);
  remote::frame_builder builder(room, 1, 1);
  remote::write_body(builder.body(), remote::open_answer{{}, 1, memory.answer(choice < 128)});
  require(!builder.finish().empty(), "the answer to a command that was begun fits into a frame");
}

/// The body as it would be written; nothing when it is not one of these.
template <class Message>
void check_body(std::span<const std::uint8_t> body, std::uint8_t choice) {
  Message message;
  if (!remote::read_body(body, message)) return;
  bytes room(std::max<std::size_t>(body.size(), 1));
  remote::frame_writer out(room);
  remote::write_body(out, message);
  require(out.ok() && out.size() == body.size() && std::ranges::equal(std::span(room).first(out.size()), body),
          "a body has one form");
  if constexpr (requires { message.command; }) play_command(message.params, choice);
}

/// The order is that of frame_kinds.
constexpr std::array<void (*)(std::span<const std::uint8_t>, std::uint8_t), frame_kind_count> checks{
    check_body<remote::empty_request>,  check_body<remote::plain_answer>,  check_body<remote::refusal_answer>,
    check_body<remote::hello_answer>,   check_body<remote::open_request>,  check_body<remote::open_answer>,
    check_body<remote::invoke_request>, check_body<remote::invoke_answer>, check_body<remote::close_request>,
    check_body<remote::share_request>,  check_body<remote::share_answer>,  check_body<remote::release_request>,
    check_body<remote::status_answer>,  check_body<remote::log_request>,   check_body<remote::log_answer>,
};

void check_frame(std::span<const std::uint8_t> packet) {
  remote::frame frame;
  if (!remote::read_frame(packet, frame)) return;
  bytes room(packet.size());
  remote::frame_builder builder(room, frame.header.kind, frame.header.sequence);
  builder.body().bytes(frame.body);
  const auto written = builder.finish();
  require(written.size() == packet.size() && frame.body.size() == packet.size() - remote::header_size,
          "a frame is its header and its body");
  require(frame.header.version != remote::wire_version || std::ranges::equal(written, packet),
          "a frame of this version has one form");
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  if (size < 2) return 0;
  // A block of exactly its size: the sanitizer sees a byte too much.
  const bytes rest(data + 2, data + size);
  check_frame(rest);
  checks[data[0] % frame_kind_count](rest, data[1]);
  return 0;
}
