#include "tests/remote/slot_client.h"

#include <stdexcept>

namespace hosted_tee::testing {

slot_client::slot_client(const std::string& path) : slot_client(path, make_shared_file(wire_slots.size())) {}

slot_client::slot_client(const std::string& path, shared_file file)
    : raw_client(path), memory_(std::move(file.memory)) {
  greet();
  const auto told =
      ask<remote::plain_answer>(remote::frame_kind::use_slots, remote::empty_request{}, {file.file.get()});
  if (told.done.result != TEEC_SUCCESS) throw std::runtime_error("the server does not take the slots");
}

void slot_client::mark(const bytes& frame, std::uint32_t word, bool always) {
  std::copy(frame.begin(), frame.end(), memory_.request_bytes());
  if (memory_.request().exchange(word) == 1 || always) send({0});
}

raw_answer slot_client::take() {
  if (!eventually([&] { return memory_.answer().load() > 1; })) return {};
  const bytes packet(memory_.answer_bytes(), memory_.answer_bytes() + memory_.answer().exchange(0));
  remote::frame frame;
  if (!remote::read_frame(packet, frame)) throw std::runtime_error("what the server answered is no frame");
  return {frame.header.kind, frame.header.version, frame.header.sequence, {frame.body.begin(), frame.body.end()}};
}

bool slot_client::waits_for_sleep() const {
  return eventually([&] { return memory_.request().load() == 1; });
}

bool slot_client::is_refused() {
  const raw_answer answer = receive();
  remote::refusal_answer why;
  return answer.kind == remote::refused_kind && remote::read_body(answer.body, why) &&
         why.reason == remote::refusal::malformed && is_closed();
}

}  // namespace hosted_tee::testing
