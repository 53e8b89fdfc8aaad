#include "client/texts/roff.h"

namespace texts {

std::string roff_escaped(std::string_view text) {
  std::string out;
  for (const char c : text) {
    if (c == '\\') {
      out += "\\e";
    } else if (c == '-') {
      out += "\\-";
    } else {
      out += c;
    }
  }
  return out.starts_with('.') || out.starts_with('\'') ? "\\&" + out : out;
}

std::string roff_sentences(std::string_view text) {
  std::string out;
  for (std::size_t from = 0, end = 0; (end = text.find(". ", from)) != std::string_view::npos;) {
    from = end + 2;
    if (text.substr(0, end).ends_with("e.g")) continue;
    out += roff_escaped(text.substr(0, end + 1)) + "\n";
    text.remove_prefix(from);
    from = 0;
  }
  return out + roff_escaped(text) + "\n";
}

}  // namespace texts
