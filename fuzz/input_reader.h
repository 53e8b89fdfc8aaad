// A fuzzer's input as a sequence of choices. An input that ends gives zeros: every prefix of an input is an input.
#ifndef FUZZ_INPUT_READER_H_
#define FUZZ_INPUT_READER_H_

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace fuzzing {

using bytes = std::vector<std::uint8_t>;

class input_reader {
 public:
  explicit input_reader(std::span<const std::uint8_t> input) : rest_(input) {}

  [[nodiscard]] bool empty() const { return rest_.empty(); }

  std::uint64_t number(std::size_t width) {
    std::uint64_t value = 0;
    for (std::size_t i = 0; i < width && !rest_.empty(); ++i) {
      value |= std::uint64_t{rest_.front()} << (8 * i);
      rest_ = rest_.subspan(1);
    }
    return value;
  }
  std::uint8_t u8() { return static_cast<std::uint8_t>(number(1)); }
  std::uint32_t u32() { return static_cast<std::uint32_t>(number(4)); }

  /// below answers a number less than `count`, which is from 1 to 256.
  std::size_t below(std::size_t count) { return u8() % count; }

  /// pick answers one of the entries of a table.
  template <class Table>
  const typename Table::value_type& pick(const Table& table) {
    return table[below(table.size())];
  }

  /// take answers the next `size` bytes, or what is left of them.
  bytes take(std::size_t size) {
    const auto part = rest_.first(std::min(size, rest_.size()));
    rest_ = rest_.subspan(part.size());
    return {part.begin(), part.end()};
  }

 private:
  std::span<const std::uint8_t> rest_;
};

}  // namespace fuzzing

#endif  // FUZZ_INPUT_READER_H_
