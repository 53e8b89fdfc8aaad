// A program's command line as data, for what is written about it: its manual page and the completions of shells.
#ifndef KEYMASTER_CLIENT_TEXTS_COMMAND_TREE_H_
#define KEYMASTER_CLIENT_TEXTS_COMMAND_TREE_H_

#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace texts {

/// What a shell can offer for a value: nothing, files, folders, or these words (one of them, or several with commas).
enum class value_kind { other, file, folder, word, words };

struct option_entry {
  std::vector<std::string> names;  ///< with their dashes, the short ones first
  std::string value;               ///< the placeholder of its value; empty: it has none
  value_kind kind = value_kind::other;
  std::vector<std::string> words;
  std::string description;
  std::string group;
};

struct argument_entry {
  std::string name;
  std::string description;
  bool required = false;
  bool names_a_file = false;
};

struct command_entry {
  std::string name;  ///< "kmctl" at the top, "verify" below "statement"
  std::string description;
  std::string footer;  ///< what stands below the options: explanations and examples
  std::vector<argument_entry> arguments;
  std::vector<option_entry> options;  ///< in the order of the command's own help
  std::vector<command_entry> commands;
};

/// describe reads the whole command line of a program. Options without a group are hidden, and left out.
[[nodiscard]] command_entry describe(const CLI::App& app);

/// option_summary is what fits one line of a shell: the description up to where details begin.
[[nodiscard]] std::string option_summary(const option_entry& option);

}  // namespace texts

#endif  // KEYMASTER_CLIENT_TEXTS_COMMAND_TREE_H_
