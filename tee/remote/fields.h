// Fields of a frame's body in one direction or the other: a body's description calls the same names of either class.
#ifndef TEE_REMOTE_FIELDS_H_
#define TEE_REMOTE_FIELDS_H_

#include <algorithm>
#include <array>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "tee/remote/cursor.h"
#include "tee/remote/parameters.h"
#include "tee/remote/wire.h"

namespace hosted_tee::remote {

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

/// Writes the same fields.
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

}  // namespace hosted_tee::remote

#endif  // TEE_REMOTE_FIELDS_H_
