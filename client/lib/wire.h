// Reading and writing the bodies of the command protocol: little-endian words and length-prefixed fields.
#ifndef KEYMASTER_CLIENT_LIB_WIRE_H_
#define KEYMASTER_CLIENT_LIB_WIRE_H_

#include <cstdint>
#include <stdexcept>
#include <string>

#include "client/lib/bytes.h"

namespace keymaster::client {

/// What came from the TA, or a file, does not have the form it must have.
class format_error : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

/// append_number writes the low `width` bytes of `number`, the lowest first.
template <class Bytes>
void append_number(Bytes& out, std::uint64_t number, int width) {
  for (int i = 0; i < width; ++i) {
    out.push_back(static_cast<std::uint8_t>(number >> (8 * i)));
  }
}

template <class Bytes>
void append_u32(Bytes& out, std::uint32_t number) {
  append_number(out, number, 4);
}

template <class Bytes>
void append_bytes(Bytes& out, byte_view data) {
  out.insert(out.end(), data.begin(), data.end());
}

/// append_block writes a 32-bit length and the bytes. Throws std::length_error for 4 GiB and more.
template <class Bytes>
void append_block(Bytes& out, byte_view data) {
  if (data.size() > UINT32_MAX) {
    throw std::length_error("a field of a request is limited to 4 GiB");
  }
  append_u32(out, static_cast<std::uint32_t>(data.size()));
  append_bytes(out, data);
}

/// Reads a body front to back. Every read throws format_error instead of passing the end.
class byte_reader {
 public:
  explicit byte_reader(byte_view data) : rest_(data) {}

  [[nodiscard]] std::size_t remaining() const { return rest_.size(); }

  byte_view read_bytes(std::size_t count) {
    if (count > rest_.size()) {
      throw format_error("a field of " + std::to_string(count) + " bytes runs past the end, " +
                         std::to_string(rest_.size()) + " remain");
    }
    const byte_view field = rest_.first(count);
    rest_ = rest_.subspan(count);
    return field;
  }

  std::uint64_t read_number(int width) {
    std::uint64_t number = 0;
    const byte_view field = read_bytes(static_cast<std::size_t>(width));
    for (int i = width - 1; i >= 0; --i) {
      number = number << 8 | field[static_cast<std::size_t>(i)];
    }
    return number;
  }

  std::uint32_t read_u32() { return static_cast<std::uint32_t>(read_number(4)); }

  byte_view read_block() { return read_bytes(read_u32()); }

 private:
  byte_view rest_;
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_WIRE_H_
