// What a sub-command takes, told without the parser's own headers, which cost each file that sees them several seconds
// of compiling. Names and meanings are the parser's (CLI11).
#ifndef KEYMASTER_CLIENT_KMCTL_COMMAND_LINE_H_
#define KEYMASTER_CLIENT_KMCTL_COMMAND_LINE_H_

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace kmctl {

/// An option, a flag or an argument. Copies are the same option, which its command owns; all but queries answer it.
class option {
 public:
  option() = default;  ///< none; nothing may be called
  explicit option(CLI::Option& made) : made_(&made) {}

  /// The word that stands for the value in the help; empty: the name of an argument is enough.
  option type_name(const std::string& word) const;
  option group(const std::string& heading) const;
  option required() const;
  option needs(option other) const;
  option excludes(option other) const;
  option one_of(const std::vector<std::string>& words) const;
  /// Shows the variable's present value in the help, as the default.
  option capture_default() const;
  /// Values of all uses become one, with `between` between them.
  option join(char between) const;
  option take_last() const;
  /// Each use is handed over when it is read, and not only the last one at the end.
  option trigger_on_parse() const;

  [[nodiscard]] bool is_given() const;
  [[nodiscard]] bool is_required() const;
  /// The latest value, of an option that is given.
  [[nodiscard]] const std::string& value() const;

 private:
  CLI::Option* made_ = nullptr;
};

/// A sub-command, or the program itself. Variables must live as long as the command line.
class command_line {
 public:
  explicit command_line(CLI::App& app) : app_(app) {}

  /// A name without dashes is an argument's.
  option add_option(const std::string& name, std::string& value, const std::string& help);
  option add_option(const std::string& name, std::optional<std::string>& value, const std::string& help);
  option add_option_function(const std::string& name, const std::function<void(const std::string&)>& take,
                             const std::string& help);
  option add_flag(const std::string& name, bool& is_given, const std::string& help);
  option add_flag_callback(const std::string& name, std::function<void()> take, const std::string& help);
  void footer(const std::string& text);

  /// The program's options may stand behind a sub-command too.
  [[nodiscard]] command_line add_subcommand(const std::string& name, const std::string& description);
  void require_subcommand();

  /// What happens when the command's name is met, and when all of the command line is read.
  void when_met(std::function<void()> act);
  void when_read(std::function<void()> act);

 private:
  CLI::App& app_;
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_COMMAND_LINE_H_
