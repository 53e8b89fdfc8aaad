// Numbers as the statements have them: "%lld" and "%f" of the C locale, exact, without a C library.
#ifndef KEYMASTER_SOTER_JSON_NUMBER_H_
#define KEYMASTER_SOTER_JSON_NUMBER_H_

#include <cstdint>

namespace keymaster {

/// The longest texts of whole numbers and of others. A longer one is refused and never cut: a statement that is signed
/// must not tell another number than it was given.
inline constexpr uint32_t json_whole_number_limit = 11;
inline constexpr uint32_t json_fraction_limit = 29;

/// The text of a number, without a NUL.
struct json_number_text {
  char text[json_fraction_limit] = {};
  uint32_t length = 0;  // 0: the number has no text
};

/// json_format_number writes a whole number of a magnitude below 2^63 in decimal, and any other with six decimals,
/// rounded half to even. No text: it would be too long, or the number is none (infinite, NaN).
[[nodiscard]] json_number_text json_format_number(double number);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_JSON_NUMBER_H_
