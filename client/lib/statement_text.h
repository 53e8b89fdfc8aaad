// The JSON texts of statements, read so strictly that a text has one reading and a reading one text.
#ifndef KEYMASTER_CLIENT_LIB_STATEMENT_TEXT_H_
#define KEYMASTER_CLIENT_LIB_STATEMENT_TEXT_H_

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace keymaster::client {

using statement_value = std::variant<std::uint64_t, std::string>;

struct statement_member {
  std::string name;
  statement_value value;

  friend bool operator==(const statement_member&, const statement_member&) = default;
};

/// write_statement_text gives the one text of these members: no whitespace; quote, backslash and slash behind a
/// backslash; backspace, form feed, newline, carriage return and tab as backslash and b, f, n, r, t; every other byte,
/// other control characters too, as it is.
[[nodiscard]] std::string write_statement_text(const std::vector<statement_member>& members);

/// read_statement_text gives the members of an object of texts and whole numbers, in their order. Throws
/// statement_refused with the check encoding (not UTF-8), json (not such an object) or form (not the text that
/// write_statement_text gives for its members).
[[nodiscard]] std::vector<statement_member> read_statement_text(std::string_view text);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_STATEMENT_TEXT_H_
