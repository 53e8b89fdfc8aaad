#include "client/lib/statement_text.h"

#include <array>
#include <nlohmann/json.hpp>

#include "client/lib/statement_refused.h"
#include "client/lib/utf8.h"

namespace keymaster::client {
namespace {

using json = nlohmann::json;

/// The characters that are written with a backslash, each above the letter that stands for it.
constexpr std::string_view escaped = "\"\\/\b\f\n\r\t";
constexpr std::string_view letters = "\"\\/bfnrt";

void append_quoted(std::string& out, std::string_view text) {
  out += '"';
  for (const char character : text) {
    if (const std::size_t place = escaped.find(character); place != std::string_view::npos) {
      out += '\\';
      out += letters[place];
    } else {
      out += character;
    }
  }
  out += '"';
}

/// The JSON library refuses control characters, which statements hold as they are. They are given to it as \u00xx.
/// Where that changes the meaning of a text, it makes no JSON, or members that are not written as the text was.
std::string escape_control_characters(std::string_view text) {
  constexpr std::string_view digits = "0123456789abcdef";
  std::string out;
  out.reserve(text.size());
  for (const char character : text) {
    const auto byte = static_cast<unsigned char>(character);
    if (byte < 0x20) {
      out += "\\u00";
      out += digits[byte >> 4U];
      out += digits[byte & 0xFU];
    } else {
      out += character;
    }
  }
  return out;
}

/// Takes the events of the parser, which come in the order of the text, and stops at what no statement has.
class member_collector {
 public:
  explicit member_collector(std::vector<statement_member>& members) : members_(members) {}

  [[nodiscard]] const std::string& fault() const { return fault_; }

  bool null() { return refuse("a null"); }
  bool boolean(bool /*value*/) { return refuse("a truth value"); }
  bool number_integer(json::number_integer_t value) {
    return value < 0 ? refuse("a negative number") : take(static_cast<std::uint64_t>(value));
  }
  bool number_unsigned(json::number_unsigned_t value) { return take(value); }
  bool number_float(json::number_float_t /*value*/, const std::string& text) {
    return refuse("the number " + text + ", which is not a whole one of 64 bits");
  }
  bool string(std::string& text) { return take(std::move(text)); }
  bool binary(json::binary_t& /*data*/) { return refuse("binary data"); }
  bool start_object(std::size_t /*size*/) { return ++depth_ == 1 || refuse("an object in the object"); }
  bool key(std::string& name) {
    name_ = std::move(name);
    return true;
  }
  bool end_object() { return true; }
  bool start_array(std::size_t /*size*/) { return refuse("an array"); }
  bool end_array() { return true; }
  bool parse_error(std::size_t at, const std::string& /*token*/, const json::exception& /*fault*/) {
    fault_ = "it can't be parsed near character " + std::to_string(at);
    return false;
  }

 private:
  bool refuse(const std::string& what) {
    fault_ = "it holds " + what;
    return false;
  }
  bool take(statement_value value) {
    if (depth_ == 0) {
      return refuse("no object");
    }
    members_.push_back({.name = std::move(name_), .value = std::move(value)});
    return true;
  }

  std::vector<statement_member>& members_;
  std::string name_;
  std::string fault_;
  int depth_ = 0;
};

}  // namespace

std::string write_statement_text(const std::vector<statement_member>& members) {
  std::string text = "{";
  for (const statement_member& member : members) {
    if (text.size() > 1) {
      text += ',';
    }
    append_quoted(text, member.name);
    text += ':';
    if (const auto* const number = std::get_if<std::uint64_t>(&member.value)) {
      text += std::to_string(*number);
    } else {
      append_quoted(text, std::get<std::string>(member.value));
    }
  }
  return text + '}';
}

std::vector<statement_member> read_statement_text(std::string_view text) {
  if (const auto at = invalid_utf8_at(as_bytes(text))) {
    throw statement_refused(statement_check::encoding,
                            "the text of the statement is not UTF-8 at byte " + std::to_string(*at));
  }
  std::vector<statement_member> members;
  member_collector collector(members);
  if (!json::sax_parse(escape_control_characters(text), &collector)) {
    throw statement_refused(statement_check::json,
                            "the text of the statement is not an object of texts and numbers: " + collector.fault());
  }
  if (write_statement_text(members) != text) {
    throw statement_refused(statement_check::form, "the text of the statement is not written as the TA writes it");
  }
  return members;
}

}  // namespace keymaster::client
