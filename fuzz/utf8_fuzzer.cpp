// Texts from any bytes: the check of UTF-8 judges a text, and every part of it, as a decoder does.
#include "fuzz/fuzz_device.h"
#include "soter/text.h"
#include "tests/support/utf8_decoder.h"

using namespace keymaster;

namespace fuzzing {
namespace {

/// The longest text whose parts are all judged.
constexpr std::size_t short_text = 64;

void compare(std::span<const std::uint8_t> text) {
  require(is_utf8(text) == testing_support::is_well_formed_utf8(text), "a text is judged as the decoder judges it");
}

void compare_parts(std::span<const std::uint8_t> text) {
  for (std::size_t from = 0; from < text.size(); ++from) {
    for (std::size_t size = 0; size <= text.size() - from; ++size) compare(text.subspan(from, size));
  }
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  // A block of exactly its size: the sanitizer sees a byte too much.
  const bytes text(data, data + size);
  compare(text);
  compare_parts(std::span(text).first(std::min(size, short_text)));
  return 0;
}
