#include "tests/ec/reference_der.h"

#include <fmt/format.h>

#include <stdexcept>

namespace testing_support {
namespace {

/// Carries the trace line of a form that is refused.
struct refusal : std::runtime_error {
  using std::runtime_error::runtime_error;
};

class input {
 public:
  explicit input(bytes data) : data_(std::move(data)) {}

  [[nodiscard]] std::size_t left() const { return data_.size() - at_; }

  std::uint8_t next() {
    if (left() == 0) throw refusal("Decode length failed");
    return data_[at_++];
  }

  void expect_tag(std::uint8_t tag) {
    const std::uint8_t got = next();
    if (got != tag) throw refusal(fmt::format("Wrong tag, expect {:#04x}, got {:#04x}", tag, got));
  }

  std::uint32_t length() {
    const std::uint8_t first = next();
    if (first < 0x80) return first;
    if (first > 0x84) throw refusal("Decode length failed");
    std::uint32_t value = 0;
    for (int count = first - 0x80; count > 0; --count) value = value * 256 + next();
    return value;
  }

  /// A number as it stands, but for one zero byte in front.
  bytes integer() {
    expect_tag(0x02);
    const std::uint32_t size = length();
    if (size > left()) {
      throw refusal(
          fmt::format("Wrong length of integer, {}B available, got {}B", left(), static_cast<std::int32_t>(size)));
    }
    bytes value(data_.begin() + static_cast<std::ptrdiff_t>(at_),
                data_.begin() + static_cast<std::ptrdiff_t>(at_ + size));
    at_ += size;
    if (!value.empty() && value.front() == 0) value.erase(value.begin());
    return value;
  }

 private:
  bytes data_;
  std::size_t at_ = 0;
};

bytes fitted(char name, const bytes& value, std::size_t half) {
  if (value.size() > half) {
    throw refusal(fmt::format("Wrong length of {}, expect max {}B, got {}B", name, half, value.size()));
  }
  return join({bytes(half - value.size()), value});
}

/// A length as the TA writes it: one byte up to 126, and behind 0x81 up to 254.
bytes length_of(std::size_t size) {
  const auto low = static_cast<std::uint8_t>(size);
  if (size <= 126) return {low};
  if (size < 255) return {0x81, low};
  return {0x82, static_cast<std::uint8_t>(size >> 8), low};
}

bytes integer_of(const bytes& number) {
  bytes content = number;
  while (!content.empty() && content.front() == 0) content.erase(content.begin());
  if (!content.empty() && content.front() >= 0x80) content.insert(content.begin(), 0);
  return content;
}

}  // namespace

std::optional<bytes> reference_encode(const bytes& r, const bytes& s) {
  const bytes first = integer_of(r), second = integer_of(s);
  const bytes body = join({{0x02}, length_of(first.size()), first, {0x02}, length_of(second.size()), second});
  if (first.size() == 127 || second.size() == 127 || body.size() == 127) return std::nullopt;
  return join({{0x30}, length_of(body.size()), body});
}

decoded reference_decode(const bytes& der, std::size_t half) {
  decoded verdict;
  try {
    if (der.size() <= 1) throw refusal("Wrong der length\n");
    input in(der);
    in.expect_tag(0x30);
    const std::uint32_t body = in.length();
    if (body != in.left()) {
      throw refusal(
          fmt::format("Wrong length of sequence, expect {}B, got {}B", in.left(), static_cast<std::int32_t>(body)));
    }
    verdict.r = fitted('R', in.integer(), half);
    verdict.s = fitted('S', in.integer(), half);
    const std::optional<bytes> canonical = reference_encode(verdict.r, verdict.s);
    if (!canonical)
      return {TEE_ERROR_OUT_OF_MEMORY, {"Unfilled buffer, size calculation error", "Out of memory"}, {}, {}};
    if (canonical->size() != der.size()) throw refusal("Encoding size mismatch");
    if (*canonical != der) throw refusal("Encoding mismatch");
    return verdict;
  } catch (const refusal& reason) {
    return {TEE_ERROR_GENERIC, {reason.what()}, {}, {}};
  }
}

}  // namespace testing_support
