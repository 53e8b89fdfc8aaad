#include <fmt/format.h>
#include <fmt/ranges.h>

#include <ostream>

#include "client/texts/completions.h"

namespace texts {
namespace {

// Answers whether the words before the cursor lead to just this sub-command: a sub-command goes down, the word behind
// an option with a value is that value.
constexpr const char* frame = R"(# Completion of {0} for fish.
function __fish_{0}_at
    set -l at {0}
    set -l skip 0
    for word in (commandline -opc)[2..-1]
        if test $skip = 1
            set skip 0
        else if contains -- $word {1}
            set skip 1
        else if contains -- "$at $word" {2}
            set at "$at $word"
        end
    end
    test "$at" = "$argv"
end

complete -c {0} -f
)";

std::string quoted(const std::string& text) {
  std::string out = "'";
  for (const char c : text) {
    if (c == '\'' || c == '\\') out += '\\';
    out += c;
  }
  return out + "'";
}

std::string value_flags(const option_entry& option) {
  switch (option.kind) {
    case value_kind::file:
      return " -r -F";
    case value_kind::folder:
      return " -x -a '(__fish_complete_directories)'";
    case value_kind::word:
      return fmt::format(" -x -a '{}'", fmt::join(option.words, " "));
    case value_kind::words:
      return fmt::format(" -x -a '(__fish_append , {})'", fmt::join(option.words, " "));
    default:
      return option.value.empty() ? "" : " -x";
  }
}

void write_option(const option_entry& option, const std::string& command, const std::string& condition,
                  std::ostream& out) {
  out << "complete -c " << command << condition;
  for (const std::string& name : option.names) {
    out << (name.starts_with("--") ? " -l " + name.substr(2) : " -s " + name.substr(1));
  }
  out << value_flags(option) << " -d " << quoted(option_summary(option)) << "\n";
}

void write_level(const command_entry& command, const std::string& path, const std::string& program, std::ostream& out) {
  const std::string condition = fmt::format(" -n '__fish_{}_at {}'", program, path);
  for (const option_entry& option : command.options) {
    if (path != program || option.names.back() == "--help" || option.names.back() == "--version") {
      write_option(option, program, condition, out);
    }
  }
  for (const argument_entry& argument : command.arguments) {
    if (!argument.names_a_file) continue;
    out << "complete -c " << program << condition << " -F\n";
    break;
  }
  for (const command_entry& below : command.commands) {
    out << fmt::format("complete -c {}{} -a {} -d {}\n", program, condition, below.name, quoted(below.description));
  }
  for (const command_entry& below : command.commands) write_level(below, path + " " + below.name, program, out);
}

void collect(const command_entry& command, const std::string& path, std::string& with_values, std::string& paths) {
  for (const option_entry& option : command.options) {
    if (!option.value.empty()) with_values += fmt::format(" {}", fmt::join(option.names, " "));
  }
  for (const command_entry& below : command.commands) {
    paths += " " + quoted(path + " " + below.name);
    collect(below, path + " " + below.name, with_values, paths);
  }
}

}  // namespace

void write_fish_completion(const command_entry& program, std::ostream& out) {
  std::string with_values;
  std::string paths;
  collect(program, program.name, with_values, paths);
  out << fmt::format(fmt::runtime(frame), program.name, with_values.substr(1), paths.substr(1));
  for (const option_entry& option : program.options) {
    if (option.names.back() != "--help") write_option(option, program.name, "", out);
  }
  write_level(program, program.name, program.name, out);
}

}  // namespace texts
