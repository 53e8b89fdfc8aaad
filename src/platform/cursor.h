// The cursors: the only code that steps through bytes whose lengths somebody else chose.
// They compare a length with what remains before they form an address, and they read every byte once.
#ifndef KEYMASTER_PLATFORM_CURSOR_H_
#define KEYMASTER_PLATFORM_CURSOR_H_

#include <cstdint>
#include <cstring>
#include <span>

namespace keymaster {

/// byte_reader reads a buffer front to back. A read that doesn't fit answers false and moves nothing.
class byte_reader {
 public:
  explicit byte_reader(std::span<const uint8_t> bytes) : rest_(bytes) {}

  /// read_u32 reads a little-endian number. The bytes are loaded one by one, each exactly once: the address may be odd,
  /// and the buffer may be memory that the normal world changes, where a second load could give another value.
  [[nodiscard]] bool read_u32(uint32_t& value) {
    if (rest_.size() < sizeof value) return false;
    const volatile uint8_t* bytes = rest_.data();
    const uint32_t b0 = bytes[0], b1 = bytes[1], b2 = bytes[2], b3 = bytes[3];
    value = b0 | (b1 << 8) | (b2 << 16) | (b3 << 24);
    rest_ = rest_.subspan(sizeof value);
    return true;
  }

  /// read_bytes takes `length` bytes as a view of the buffer.
  [[nodiscard]] bool read_bytes(uint32_t length, std::span<const uint8_t>& bytes) {
    if (length > rest_.size()) return false;
    bytes = rest_.first(length);
    rest_ = rest_.subspan(length);
    return true;
  }

  /// read_block takes a length word and as many bytes.
  [[nodiscard]] bool read_block(std::span<const uint8_t>& bytes) {
    const std::span<const uint8_t> start = rest_;
    uint32_t length = 0;
    if (read_u32(length) && read_bytes(length, bytes)) return true;
    rest_ = start;
    return false;
  }

  /// copy_to copies `size` bytes to `target`.
  [[nodiscard]] bool copy_to(void* target, uint32_t size) {
    std::span<const uint8_t> bytes;
    if (!read_bytes(size, bytes)) return false;
    if (!bytes.empty()) std::memcpy(target, bytes.data(), bytes.size());
    asm volatile("" : : "r"(target) : "memory");
    return true;
  }

  [[nodiscard]] uint32_t remaining() const { return static_cast<uint32_t>(rest_.size()); }
  [[nodiscard]] std::span<const uint8_t> rest() const { return rest_; }

 private:
  std::span<const uint8_t> rest_;
};

/// byte_writer fills a buffer front to back. A write that doesn't fit answers false and writes nothing.
class byte_writer {
 public:
  explicit byte_writer(std::span<uint8_t> bytes) : all_(bytes) {}

  [[nodiscard]] bool write_bytes(const void* bytes, uint32_t length) {
    std::span<uint8_t> place;
    if (!reserve(length, place)) return false;
    if (length != 0) std::memcpy(place.data(), bytes, length);
    return true;
  }
  [[nodiscard]] bool write_u32(uint32_t value) { return write_bytes(&value, sizeof value); }

  /// reserve takes the next `length` bytes for somebody else to fill.
  [[nodiscard]] bool reserve(uint32_t length, std::span<uint8_t>& place) {
    if (length > remaining()) return false;
    place = all_.subspan(used_, length);
    used_ += length;
    return true;
  }

  [[nodiscard]] uint32_t written() const { return used_; }
  [[nodiscard]] uint32_t remaining() const { return static_cast<uint32_t>(all_.size()) - used_; }
  [[nodiscard]] std::span<uint8_t> rest() const { return all_.subspan(used_); }

 private:
  std::span<uint8_t> all_;
  uint32_t used_ = 0;
};

}  // namespace keymaster

#endif  // KEYMASTER_PLATFORM_CURSOR_H_
