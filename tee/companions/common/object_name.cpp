#include "tee/companions/common/object_name.h"

#include <iterator>

namespace keymaster::companion {
namespace {

constexpr char digits[] = "0123456789abcdef";

}  // namespace

object_name& object_name::add(std::string_view text) {
  for (const char character : text) {
    if (length_ < sizeof text_) text_[length_++] = character;
  }
  return *this;
}

object_name& object_name::add_hex(uint16_t number) {
  const char text[] = {digits[number >> 12], digits[number >> 8 & 15], digits[number >> 4 & 15], digits[number & 15]};
  return add({text, sizeof text});
}

object_name& object_name::add_decimal(uint32_t number) {
  char text[10] = {};  // of the largest number
  char* first = std::end(text);
  do {
    *--first = digits[number % 10];
    number /= 10;
  } while (number != 0);
  return add({first, static_cast<std::size_t>(std::end(text) - first)});
}

}  // namespace keymaster::companion
