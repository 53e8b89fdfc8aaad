#include "tests/support/bytes.h"

#include <fmt/format.h>

#include <stdexcept>

namespace testing_support {

bytes from_hex(std::string_view hex) {
  if (hex.size() % 2 != 0) throw std::invalid_argument("odd number of hex digits");
  bytes data;
  for (std::size_t i = 0; i < hex.size(); i += 2) {
    data.push_back(static_cast<std::uint8_t>(std::stoul(std::string(hex.substr(i, 2)), nullptr, 16)));
  }
  return data;
}

std::string to_hex(std::span<const std::uint8_t> data) {
  std::string hex;
  for (const std::uint8_t byte : data) hex += fmt::format("{:02x}", byte);
  return hex;
}

bytes from_text(std::string_view text) {
  return {text.begin(), text.end()};
}

bytes u32(std::uint32_t value) {
  bytes data;
  for (int shift = 0; shift < 32; shift += 8) data.push_back(static_cast<std::uint8_t>(value >> shift));
  return data;
}

bytes u64(std::uint64_t value) {
  bytes data;
  for (int shift = 0; shift < 64; shift += 8) data.push_back(static_cast<std::uint8_t>(value >> shift));
  return data;
}

std::uint32_t u32_at(std::span<const std::uint8_t> data, std::size_t offset) {
  std::uint32_t value = 0;
  for (std::size_t i = 0; i < 4; ++i) value |= std::uint32_t{data[offset + i]} << (8 * i);
  return value;
}

bytes join(std::initializer_list<bytes> parts) {
  bytes all;
  for (const bytes& part : parts) all.insert(all.end(), part.begin(), part.end());
  return all;
}

bytes prefixed(std::span<const std::uint8_t> data) {
  return join({u32(static_cast<std::uint32_t>(data.size())), bytes(data.begin(), data.end())});
}

bytes flip(bytes data, std::size_t offset) {
  data.at(offset) ^= 1;
  return data;
}

bytes pattern(std::size_t size, std::uint32_t seed) {
  bytes data(size);
  std::uint32_t state = seed * 2654435761U + 1;
  for (std::uint8_t& byte : data) {
    state = state * 1664525U + 1013904223U;
    byte = static_cast<std::uint8_t>(state >> 24);
  }
  return data;
}

}  // namespace testing_support
