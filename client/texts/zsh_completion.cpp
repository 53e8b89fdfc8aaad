#include <fmt/format.h>
#include <fmt/ranges.h>

#include <ostream>

#include "client/texts/completions.h"

namespace texts {
namespace {

// A text inside single quotes and inside an entry of _arguments, where brackets and colons mean something.
std::string escaped(const std::string& text) {
  std::string out;
  for (const char c : text) {
    if (c == '\'') {
      out += "'\\''";
    } else if (c == '[' || c == ']' || c == ':' || c == '\\') {
      out += std::string("\\") + c;
    } else {
      out += c;
    }
  }
  return out;
}

std::string action_of(const option_entry& option) {
  switch (option.kind) {
    case value_kind::file:
      return "_files";
    case value_kind::folder:
      return "_files -/";
    case value_kind::word:
      return fmt::format("({})", fmt::join(option.words, " "));
    case value_kind::words:
      return fmt::format("_values -s , value {}", fmt::join(option.words, " "));
    default:
      return " ";
  }
}

void write_entry(const option_entry& option, std::ostream& out) {
  const std::string value = option.value.empty() ? "" : fmt::format(":{}:{}", escaped(option.value), action_of(option));
  const std::string summary = escaped(option_summary(option));
  if (option.names.size() == 1) {
    out << fmt::format("    '{}[{}]{}'\n", option.names[0], summary, value);
  } else {
    out << fmt::format("    '({0})'{{{1}}}'[{2}]{3}'\n", fmt::join(option.names, " "), fmt::join(option.names, ","),
                       summary, value);
  }
}

std::string function_name(const std::string& path) {
  std::string name = "_";
  for (const char c : path) name += c == ' ' || c == '-' ? '_' : c;
  return name;
}

void write_leaf(const command_entry& command, std::ostream& out) {
  int place = 1;
  for (const argument_entry& argument : command.arguments) {
    out << fmt::format("    '{}:{}{}:{}'\n", place++, argument.required ? "" : ":", escaped(argument.name),
                       argument.names_a_file ? "_files" : " ");
  }
  out << "  )\n  _arguments -s \"${specs[@]}\"\n}\n\n";
}

void write_group(const command_entry& command, const std::string& path, std::ostream& out) {
  out << "    '1:sub-command:->command'\n    '*::argument:->argument'\n  )\n"
         "  _arguments -C -s \"${specs[@]}\"\n  case $state in\n    command)\n      local -a sub_commands=(\n";
  for (const command_entry& below : command.commands) {
    out << fmt::format("        '{}:{}'\n", below.name, escaped(below.description));
  }
  out << "      )\n      _describe -t commands sub-command sub_commands ;;\n    argument)\n      case $words[1] in\n";
  for (const command_entry& below : command.commands) {
    out << fmt::format("        {}) {} ;;\n", below.name, function_name(path + " " + below.name));
  }
  out << "      esac ;;\n  esac\n}\n\n";
}

void write_function(const command_entry& command, const std::string& path, const command_entry& program,
                    std::ostream& out) {
  for (const command_entry& below : command.commands) write_function(below, path + " " + below.name, program, out);
  out << function_name(path) << "() {\n  local curcontext=$curcontext state line\n  typeset -A opt_args\n"
      << "  local -a specs=(\n";
  for (const option_entry& option : command.options) write_entry(option, out);
  if (&command != &program) {
    for (const option_entry& option : program.options) {
      if (option.names.back() != "--help") write_entry(option, out);
    }
  }
  if (command.commands.empty()) {
    write_leaf(command, out);
  } else {
    write_group(command, path, out);
  }
}

}  // namespace

void write_zsh_completion(const command_entry& program, std::ostream& out) {
  out << "#compdef " << program.name << "\n# Completion of " << program.name << " for zsh.\n\n";
  write_function(program, program.name, program, out);
  out << fmt::format("if [[ $zsh_eval_context[-1] == loadautofunc ]]; then\n  _{0} \"$@\"\nfi\n", program.name);
}

}  // namespace texts
