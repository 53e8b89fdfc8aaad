// Bytes in tests: built, compared and printed without ceremony.
#ifndef TESTS_SUPPORT_BYTES_H_
#define TESTS_SUPPORT_BYTES_H_

#include <cstdint>
#include <initializer_list>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace testing_support {

using bytes = std::vector<std::uint8_t>;

bytes from_hex(std::string_view hex);
std::string to_hex(std::span<const std::uint8_t> data);
bytes from_text(std::string_view text);

/// Little-endian numbers, as the protocol has them.
bytes u32(std::uint32_t value);
bytes u64(std::uint64_t value);
std::uint32_t u32_at(std::span<const std::uint8_t> data, std::size_t offset);

/// join concatenates; prefixed puts a length word in front.
bytes join(std::initializer_list<bytes> parts);
bytes prefixed(std::span<const std::uint8_t> data);

/// flip inverts the lowest bit of the byte at `offset`.
bytes flip(bytes data, std::size_t offset);

/// pattern makes `size` bytes that differ from each other and by `seed`.
bytes pattern(std::size_t size, std::uint32_t seed = 1);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_BYTES_H_
