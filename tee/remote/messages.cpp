// Each body is told once, as the list of its fields, which serves both directions.
#include "tee/remote/messages.h"

#include <algorithm>
#include <concepts>
#include <string_view>
#include <type_traits>

namespace hosted_tee::remote {
namespace {

/// Reads fields, and remembers whether all were there.
class field_reader {
 public:
  explicit field_reader(std::span<const std::uint8_t> body) : in_(body) {}

  template <class Number>
  void number(Number& value) {
    ok_ = ok_ && in_.number(value);
  }
  void octets(std::array<std::uint8_t, 16>& value) {
    std::span<const std::uint8_t> data;
    ok_ = ok_ && in_.bytes(value.size(), data);
    if (ok_) std::copy(data.begin(), data.end(), value.begin());
  }
  void text(std::string& value) {
    std::uint32_t length = 0;
    std::span<const std::uint8_t> data;
    number(length);
    ok_ = ok_ && length <= longest_text && in_.bytes(length, data);
    if (ok_) value.assign(data.begin(), data.end());
  }
  template <class Slots>
  void slots(Slots& value) {
    ok_ = ok_ && read(in_, value);
  }
  /// Entries are made as they are found: a count alone must not cost memory.
  template <class Entry, class Fields>
  void list(std::vector<Entry>& entries, Fields&& fields) {
    std::uint32_t count = 0;
    number(count);
    entries.clear();
    for (std::uint32_t i = 0; i < count && ok_; ++i) fields(*this, entries.emplace_back());
  }

  [[nodiscard]] bool is_whole() const { return ok_ && in_.at_end(); }
  void require(bool holds) { ok_ = ok_ && holds; }

 private:
  frame_reader in_;
  bool ok_ = true;
};

class field_writer {
 public:
  explicit field_writer(frame_writer& out) : out_(out) {}

  template <class Number>
  void number(const Number& value) {
    out_.number(value);
  }
  void octets(const std::array<std::uint8_t, 16>& value) { out_.bytes(value); }
  void text(const std::string& value) {
    const std::string_view told = std::string_view(value).substr(0, longest_text);
    out_.number(static_cast<std::uint32_t>(told.size()));
    out_.bytes({reinterpret_cast<const std::uint8_t*>(told.data()), told.size()});
  }
  template <class Slots>
  void slots(const Slots& value) {
    write(out_, value);
  }
  template <class Entry, class Fields>
  void list(const std::vector<Entry>& entries, Fields&& fields) {
    out_.number(static_cast<std::uint32_t>(entries.size()));
    for (const Entry& entry : entries) fields(*this, entry);
  }
  void require(bool /*holds*/) {}

 private:
  frame_writer& out_;
};

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

template <class Message>
bool read_whole(std::span<const std::uint8_t> body, Message& message) {
  field_reader io(body);
  fields(io, message);
  return io.is_whole();
}

template <class Message>
void write_whole(frame_writer& out, const Message& message) {
  field_writer io(out);
  fields(io, message);
}

}  // namespace

bool read_body(std::span<const std::uint8_t> body, empty_request& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const empty_request& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, plain_answer& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const plain_answer& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, refusal_answer& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const refusal_answer& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, hello_answer& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const hello_answer& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, open_request& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const open_request& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, open_answer& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const open_answer& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, invoke_request& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const invoke_request& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, invoke_answer& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const invoke_answer& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, close_request& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const close_request& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, share_request& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const share_request& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, share_answer& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const share_answer& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, release_request& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const release_request& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, status_answer& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const status_answer& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, log_request& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const log_request& message) {
  write_whole(out, message);
}

bool read_body(std::span<const std::uint8_t> body, log_answer& message) {
  return read_whole(body, message);
}
void write_body(frame_writer& out, const log_answer& message) {
  write_whole(out, message);
}

std::size_t log_line_size(const log_line& line) {
  constexpr std::size_t numbers = 8 + 4 + 4;
  std::size_t size = numbers;
  for (const std::string* text : {&line.prefix, &line.function, &line.text}) {
    size += sizeof(std::uint32_t) + std::min<std::size_t>(text->size(), longest_text);
  }
  return size;
}

}  // namespace hosted_tee::remote
