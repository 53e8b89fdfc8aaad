// Reading and writing the fields of a frame. Both cursors compare with what is left and never add to a pointer first.
#ifndef TEE_REMOTE_CURSOR_H_
#define TEE_REMOTE_CURSOR_H_

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

namespace hosted_tee::remote {

/// Reads from the front. A read that finds too little answers false and leaves everything as it was.
class frame_reader {
 public:
  explicit frame_reader(std::span<const std::uint8_t> bytes) : rest_(bytes) {}

  [[nodiscard]] bool at_end() const { return rest_.empty(); }

  template <class Number>
  [[nodiscard]] bool number(Number& out) {
    std::span<const std::uint8_t> digits;
    if (!bytes(sizeof(Number), digits)) return false;
    std::uint64_t value = 0;
    for (std::size_t i = sizeof(Number); i > 0; --i) value = value << 8 | digits[i - 1];
    out = static_cast<Number>(value);
    return true;
  }

  /// bytes gives a view of the next `size` bytes.
  [[nodiscard]] bool bytes(std::size_t size, std::span<const std::uint8_t>& out) {
    if (size > rest_.size()) return false;
    out = rest_.first(size);
    rest_ = rest_.subspan(size);
    return true;
  }

 private:
  std::span<const std::uint8_t> rest_;
};

/// Writes behind each other. What does not fit is not written, and from then on nothing is: ok() tells at the end.
class frame_writer {
 public:
  explicit frame_writer(std::span<std::uint8_t> room) : room_(room) {}

  [[nodiscard]] bool ok() const { return ok_; }
  [[nodiscard]] std::size_t size() const { return size_; }
  [[nodiscard]] std::size_t left() const { return room_.size() - size_; }

  template <class Number>
  void number(Number value) {
    const std::span<std::uint8_t> digits = skip(sizeof(Number));
    auto rest = static_cast<std::uint64_t>(value);
    for (std::uint8_t& digit : digits) {
      digit = static_cast<std::uint8_t>(rest);
      rest >>= 8;
    }
  }

  void bytes(std::span<const std::uint8_t> data) {
    const std::span<std::uint8_t> place = skip(data.size());
    if (!place.empty()) std::memcpy(place.data(), data.data(), place.size());
  }

  /// skip leaves `size` bytes for later and gives their place; an empty one when they don't fit.
  std::span<std::uint8_t> skip(std::size_t size) {
    if (!ok_ || size > left()) {
      ok_ = false;
      return {};
    }
    const std::span<std::uint8_t> place = room_.subspan(size_, size);
    size_ += size;
    return place;
  }

 private:
  std::span<std::uint8_t> room_;
  std::size_t size_ = 0;
  bool ok_ = true;
};

}  // namespace hosted_tee::remote

#endif  // TEE_REMOTE_CURSOR_H_
