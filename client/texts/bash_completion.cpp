#include <fmt/format.h>
#include <fmt/ranges.h>

#include <algorithm>
#include <array>
#include <ostream>

#include "client/texts/completions.h"

namespace texts {
namespace {

// How the words before the cursor are read: a sub-command goes down, an option with a value skips the next word.
constexpr const char* frame = R"(# Completion of {0} for bash.
_{0}_tree() {{
  case $1 in
{1}  esac
}}

_{0}_values() {{
  case $1 in
{2}    *) return 1 ;;
  esac
}}

_{0}() {{
  local current=${{COMP_WORDS[COMP_CWORD]}} previous= at={0} word commands options arguments kind words
  COMPREPLY=()
  commands= options= arguments= kind= words=
  _{0}_tree "$at"
  for word in "${{COMP_WORDS[@]:1:COMP_CWORD-1}}"; do
    if [[ -n $previous ]]; then
      previous=
    elif [[ $word == -* ]]; then
      if _{0}_values "$at $word" || _{0}_values "{0} $word"; then previous=$word; fi
    elif [[ " $commands " == *" $word "* ]]; then
      at+=" $word"
      _{0}_tree "$at"
    fi
  done

  if [[ -n $previous ]]; then
    _{0}_values "$at $previous" || _{0}_values "{0} $previous"
  elif [[ $current == -* ]]; then
    kind=word words=$options
    if [[ $at != {0} ]]; then words+=" {3}"; fi
  elif [[ -n $commands ]]; then
    kind=word words=$commands
  else
    kind=$arguments
  fi

  local head=
  if [[ $kind == words && $current == *,* ]]; then
    head=${{current%,*}},
  fi
  case $kind in
    word | words) mapfile -t COMPREPLY < <(compgen -P "$head" -W "$words" -- "${{current#"$head"}}") ;;
    file) compopt -o filenames && mapfile -t COMPREPLY < <(compgen -f -- "$current") ;;
    folder) compopt -o filenames && mapfile -t COMPREPLY < <(compgen -d -- "$current") ;;
  esac
}}
complete -F _{0} {0}
)";

constexpr std::array<const char*, 5> kind_names{"", "file", "folder", "word", "words"};

std::string names_of(const std::vector<option_entry>& options) {
  std::vector<std::string> names;
  for (const option_entry& option : options) names.insert(names.end(), option.names.begin(), option.names.end());
  return fmt::format("{}", fmt::join(names, " "));
}

std::string names_of(const std::vector<command_entry>& commands) {
  std::string names;
  for (const command_entry& command : commands) names += (names.empty() ? "" : " ") + command.name;
  return names;
}

bool takes_files(const command_entry& command) {
  return std::any_of(command.arguments.begin(), command.arguments.end(),
                     [](const argument_entry& argument) { return argument.names_a_file; });
}

void add_branches(const command_entry& command, const std::string& path, std::string& tree, std::string& values) {
  tree += fmt::format("    '{}') commands='{}' options='{}' arguments={} ;;\n", path, names_of(command.commands),
                      names_of(command.options), takes_files(command) ? "file" : "");
  for (const option_entry& option : command.options) {
    if (option.value.empty()) continue;
    for (const std::string& name : option.names) {
      values += fmt::format("    '{} {}') kind={} words='{}' ;;\n", path, name,
                            kind_names.at(static_cast<std::size_t>(option.kind)), fmt::join(option.words, " "));
    }
  }
  for (const command_entry& below : command.commands) add_branches(below, path + " " + below.name, tree, values);
}

}  // namespace

void write_bash_completion(const command_entry& program, std::ostream& out) {
  std::string tree;
  std::string values;
  add_branches(program, program.name, tree, values);
  out << fmt::format(fmt::runtime(frame), program.name, tree, values, names_of(program.options));
}

}  // namespace texts
