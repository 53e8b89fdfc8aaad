// Each body is told once, as the list of its fields, which serves both directions.
#include "tee/remote/messages.h"

#include <algorithm>
#include <concepts>
#include <type_traits>

#include "tee/remote/fields.h"

namespace hosted_tee::remote {
namespace {

// `Message` is const on the way out.
template <class T, class Like>
concept a = std::same_as<std::remove_const_t<T>, Like>;

template <class Io, class T>
void outcome_fields(Io& io, T& m) {
  io.number(m.result);
  io.number(m.origin);
}

template <class Io, a<empty_request> T>
void fields(Io& /*io*/, T& /*m*/) {}

template <class Io, a<plain_answer> T>
void fields(Io& io, T& m) {
  outcome_fields(io, m.done);
}

template <class Io, a<refusal_answer> T>
void fields(Io& io, T& m) {
  auto reason = static_cast<std::uint32_t>(m.reason);
  io.number(reason);
  io.require(reason >= static_cast<std::uint32_t>(refusal::malformed) &&
             reason <= static_cast<std::uint32_t>(refusal::crowded));
  if constexpr (!std::is_const_v<T>) m.reason = static_cast<refusal>(reason);
}

template <class Io, a<hello_answer> T>
void fields(Io& io, T& m) {
  outcome_fields(io, m.done);
  io.number(m.frame_limit);
  io.number(m.session_limit);
  io.number(m.block_limit);
  io.number(m.memory_limit);
}

template <class Io, a<open_request> T>
void fields(Io& io, T& m) {
  io.octets(m.ta);
  io.number(m.login);
  io.number(m.group);
  io.slots(m.params);
}

template <class Io, a<open_answer> T>
void fields(Io& io, T& m) {
  outcome_fields(io, m.done);
  io.number(m.session);
  io.slots(m.params);
}

template <class Io, a<invoke_request> T>
void fields(Io& io, T& m) {
  io.number(m.session);
  io.number(m.command);
  io.slots(m.params);
}

template <class Io, a<invoke_answer> T>
void fields(Io& io, T& m) {
  outcome_fields(io, m.done);
  io.slots(m.params);
}

template <class Io, a<close_request> T>
void fields(Io& io, T& m) {
  io.number(m.session);
}

template <class Io, a<share_request> T>
void fields(Io& io, T& m) {
  io.number(m.size);
  io.number(m.flags);
}

template <class Io, a<share_answer> T>
void fields(Io& io, T& m) {
  outcome_fields(io, m.done);
  io.number(m.block);
}

template <class Io, a<release_request> T>
void fields(Io& io, T& m) {
  io.number(m.block);
}

template <class Io, a<instance_entry> T>
void fields(Io& io, T& m) {
  io.octets(m.ta);
  io.number(m.sessions);
  io.number(m.operations);
  io.number(m.heap_bytes);
  io.number(m.heap_blocks);
  io.number(m.heap_peak);
  io.number(m.heap_limit);
  io.number(m.transient_objects);
  io.number(m.persistent_objects);
}

template <class Io, a<status_answer> T>
void fields(Io& io, T& m) {
  outcome_fields(io, m.done);
  io.text(m.version);
  io.text(m.state);
  io.number(m.pid);
  io.number(m.uptime_ms);
  io.number(m.connections);
  io.number(m.accepted);
  io.number(m.refused);
  io.number(m.dropped);
  io.number(m.sessions);
  io.number(m.commands);
  io.number(m.shared_blocks);
  io.number(m.shared_bytes);
  io.number(m.trace_total);
  io.number(m.trace_kept);
  io.list(m.instances, [](auto& inner, auto& entry) { fields(inner, entry); });
}

template <class Io, a<log_request> T>
void fields(Io& io, T& m) {
  io.number(m.from);
}

template <class Io, a<log_line> T>
void fields(Io& io, T& m) {
  io.number(m.number);
  io.number(m.level);
  io.number(m.line);
  io.text(m.prefix);
  io.text(m.function);
  io.text(m.text);
}

template <class Io, a<log_answer> T>
void fields(Io& io, T& m) {
  outcome_fields(io, m.done);
  io.number(m.next);
  std::uint32_t at_end = m.at_end ? 1 : 0;
  io.number(at_end);
  io.require(at_end <= 1);
  if constexpr (!std::is_const_v<T>) m.at_end = at_end == 1;
  io.list(m.lines, [](auto& inner, auto& entry) { fields(inner, entry); });
}

}  // namespace

template <class Message>
bool read_body(std::span<const std::uint8_t> body, Message& message) {
  field_reader io(body);
  fields(io, message);
  return io.is_whole();
}

template <class Message>
void write_body(frame_writer& out, const Message& message) {
  field_writer io(out);
  fields(io, message);
}

template bool read_body(std::span<const std::uint8_t>, empty_request&);
template bool read_body(std::span<const std::uint8_t>, plain_answer&);
template bool read_body(std::span<const std::uint8_t>, refusal_answer&);
template bool read_body(std::span<const std::uint8_t>, hello_answer&);
template bool read_body(std::span<const std::uint8_t>, open_request&);
template bool read_body(std::span<const std::uint8_t>, open_answer&);
template bool read_body(std::span<const std::uint8_t>, invoke_request&);
template bool read_body(std::span<const std::uint8_t>, invoke_answer&);
template bool read_body(std::span<const std::uint8_t>, close_request&);
template bool read_body(std::span<const std::uint8_t>, share_request&);
template bool read_body(std::span<const std::uint8_t>, share_answer&);
template bool read_body(std::span<const std::uint8_t>, release_request&);
template bool read_body(std::span<const std::uint8_t>, status_answer&);
template bool read_body(std::span<const std::uint8_t>, log_request&);
template bool read_body(std::span<const std::uint8_t>, log_answer&);

template void write_body(frame_writer&, const empty_request&);
template void write_body(frame_writer&, const plain_answer&);
template void write_body(frame_writer&, const refusal_answer&);
template void write_body(frame_writer&, const hello_answer&);
template void write_body(frame_writer&, const open_request&);
template void write_body(frame_writer&, const open_answer&);
template void write_body(frame_writer&, const invoke_request&);
template void write_body(frame_writer&, const invoke_answer&);
template void write_body(frame_writer&, const close_request&);
template void write_body(frame_writer&, const share_request&);
template void write_body(frame_writer&, const share_answer&);
template void write_body(frame_writer&, const release_request&);
template void write_body(frame_writer&, const status_answer&);
template void write_body(frame_writer&, const log_request&);
template void write_body(frame_writer&, const log_answer&);

std::size_t log_line_size(const log_line& line) {
  constexpr std::size_t numbers = 8 + 4 + 4;
  std::size_t size = numbers;
  for (const std::string* text : {&line.prefix, &line.function, &line.text}) {
    size += sizeof(std::uint32_t) + std::min<std::size_t>(text->size(), longest_text);
  }
  return size;
}

}  // namespace hosted_tee::remote
