// Text in the form of roff, the language of manual pages.
#ifndef KEYMASTER_CLIENT_TEXTS_ROFF_H_
#define KEYMASTER_CLIENT_TEXTS_ROFF_H_

#include <string>
#include <string_view>

namespace texts {

/// roff_escaped makes a text mean itself: a backslash would begin an escape, a dot or an apostrophe at its start a
/// request, and a minus that is to be typed is not a hyphen.
[[nodiscard]] std::string roff_escaped(std::string_view text);

/// roff_sentences does the same with running text, and starts each sentence on a line of its own, by which roff knows
/// it. Ends with a line feed.
[[nodiscard]] std::string roff_sentences(std::string_view text);

}  // namespace texts

#endif  // KEYMASTER_CLIENT_TEXTS_ROFF_H_
