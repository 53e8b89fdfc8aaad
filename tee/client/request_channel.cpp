#include "tee/client/request_channel.h"

#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>
#include <utility>

#include "tee/client/client_failure.h"
#include "tee/socket/packet_socket.h"

namespace hosted_tee {
namespace {

using remote::refusal;

constexpr std::array<std::pair<int, TEEC_Result>, 4> connect_results{{
    {EINVAL, TEEC_ERROR_BAD_PARAMETERS},
    {ENAMETOOLONG, TEEC_ERROR_BAD_PARAMETERS},
    {EACCES, TEEC_ERROR_ACCESS_DENIED},
    {EPERM, TEEC_ERROR_ACCESS_DENIED},
}};

constexpr std::array<std::pair<refusal, TEEC_Result>, 3> refusal_results{{
    {refusal::malformed, TEEC_ERROR_BAD_FORMAT},
    {refusal::version, TEEC_ERROR_NOT_SUPPORTED},
    {refusal::crowded, TEEC_ERROR_BUSY},
}};

template <class Table, class Key>
TEEC_Result look_up(const Table& table, const Key& key) {
  for (const auto& [known, result] : table) {
    if (known == key) return result;
  }
  return TEEC_ERROR_COMMUNICATION;
}

[[noreturn]] void fail(TEEC_Result result) {
  throw client_failure(result, TEEC_ORIGIN_COMMS);
}

file_descriptor connected(const std::string& path) {
  try {
    return connect_to(path);
  } catch (const std::system_error& error) {
    fail(look_up(connect_results, error.code().value()));
  }
}

}  // namespace

request_channel::request_channel(const std::string& path)
    : channel_(connected(path)), owner_(::getpid()), room_(remote::frame_limit) {
  remote::hello_answer hello;
  ask(remote::frame_kind::hello, remote::empty_request{}, hello);
  if (hello.done.result != TEEC_SUCCESS) fail(hello.done.result);
  if (frame_channel::wants_slots()) make_slots();
}

// Without slots all goes by the socket.
void request_channel::make_slots() {
  constexpr slot_layout layout{remote::frame_limit};
  std::optional<shared_file> made;
  try {
    made = make_shared_file(layout.size());
  } catch (const std::system_error&) {
    return;
  }
  remote::plain_answer told;
  ask(remote::frame_kind::use_slots, remote::empty_request{}, told, made->file.get());
  if (told.done.result == TEEC_SUCCESS) {
    channel_.use_slots(std::move(made->memory), layout, frame_channel::side::asks);
  }
}

// The connection stays the parent's: two processes on it would take each other's answers.
void request_channel::check_owner() const {
  if (owner_ != ::getpid()) fail(TEEC_ERROR_COMMUNICATION);
}

void request_channel::break_off() {
  channel_.close();
  fail(TEEC_ERROR_COMMUNICATION);
}

void request_channel::explain_refusal(const remote::frame& refused) {
  remote::refusal_answer why;
  const bool is_told = remote::read_body(refused.body, why);
  channel_.close();
  fail(is_told ? look_up(refusal_results, why.reason) : TEEC_ERROR_COMMUNICATION);
}

std::span<const std::uint8_t> request_channel::exchange(std::span<const std::uint8_t> request, remote::frame_kind kind,
                                                        int passed) {
  if (request.empty()) fail(TEEC_ERROR_EXCESS_DATA);
  check_owner();
  if (!channel_.is_open()) fail(TEEC_ERROR_COMMUNICATION);
  // A server that refuses the connection is gone before it is asked: what it said first is still there to be read.
  const bool by_slot = channel_.has_slots() && passed < 0;
  const int error = by_slot ? channel_.put(request) : channel_.send(request, passed);
  if (error != 0 && error != EPIPE && error != ECONNRESET) break_off();
  const received answer = channel_.receive(room_);
  remote::frame told;
  if (answer.how != arrival::packet || !remote::read_frame({room_.data(), answer.size}, told)) break_off();
  if (told.header.kind == remote::refused_kind) explain_refusal(told);
  if (told.header.version != remote::wire_version || told.header.kind != remote::answer_to(kind) ||
      told.header.sequence != sequence_ || !answer.descriptors.empty()) {
    break_off();
  }
  return told.body;
}

void request_channel::wait_for_end() {
  while (channel_.receive(room_).how == arrival::packet) {
  }
}

}  // namespace hosted_tee
