// The first byte of an input of frame_fuzzer: which kind of body follows.
#ifndef FUZZ_FRAME_KINDS_H_
#define FUZZ_FRAME_KINDS_H_

#include <cstddef>
#include <cstdint>

namespace fuzzing {

enum class frame_kinds : std::uint8_t {
  empty_request,
  plain_answer,
  refusal_answer,
  hello_answer,
  open_request,
  open_answer,
  invoke_request,
  invoke_answer,
  close_request,
  share_request,
  share_answer,
  release_request,
  status_answer,
  log_request,
  log_answer,
};
inline constexpr std::size_t frame_kind_count = 15;

}  // namespace fuzzing

#endif  // FUZZ_FRAME_KINDS_H_
