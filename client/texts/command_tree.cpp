#include "client/texts/command_tree.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <array>
#include <regex>
#include <string_view>

namespace texts {
namespace {

// Arguments that are files; whatever has another name is a number or a text.
constexpr std::array<std::string_view, 5> file_arguments{"BLOB", "FILE", "HANDLE", "SIGNATURE", "STATEMENT"};

std::vector<std::string> split_list(const std::string& list) {
  static const std::regex separator(", *");
  return {std::sregex_token_iterator(list.begin(), list.end(), separator, -1), std::sregex_token_iterator()};
}

// The words that an option takes stand in its help: as CLI11 shows a set, "LEVEL:{error,info}", or behind the colon of
// "padding: none, oaep, pss".
void take_words(const std::string& type, option_entry& out) {
  static const std::regex set(R"(\{(.*)\})");
  static const std::regex listed(": ([a-z0-9-]+(, [a-z0-9-]+)+)$");
  std::smatch found;
  const bool is_set = std::regex_search(type, found, set);
  if (!is_set && !(type.starts_with("NAME") && std::regex_search(out.description, found, listed))) return;
  out.words = split_list(found[1]);
  out.kind = out.value.ends_with("...") ? value_kind::words : value_kind::word;
}

option_entry describe(const CLI::Option& option) {
  option_entry out;
  for (const std::string& name : option.get_snames()) out.names.push_back("-" + name);
  for (const std::string& name : option.get_lnames()) out.names.push_back("--" + name);
  out.description = option.get_description();
  out.group = option.get_group();
  if (option.get_type_size_max() == 0) return out;  // a flag
  const std::string type = option.get_type_name();
  out.value = type.substr(0, type.find(':'));
  if (out.value == "FILE") out.kind = value_kind::file;
  if (out.value == "FOLDER") out.kind = value_kind::folder;
  take_words(type, out);
  return out;
}

argument_entry describe_argument(const CLI::Option& argument) {
  const std::string name = argument.get_name(true);
  const bool is_file = std::find(file_arguments.begin(), file_arguments.end(), name) != file_arguments.end();
  return {name, argument.get_description(), argument.get_required(), is_file};
}

}  // namespace

command_entry describe(const CLI::App& app) {
  command_entry out{app.get_name(), app.get_description(), app.get_footer(), {}, {}, {}};
  for (const CLI::Option* option : app.get_options()) {
    if (option->get_group().empty()) continue;
    if (option->get_positional()) {
      out.arguments.push_back(describe_argument(*option));
    } else {
      out.options.push_back(describe(*option));
    }
  }
  for (const CLI::App* command : app.get_subcommands([](const CLI::App* /*any*/) { return true; })) {
    if (!command->get_group().empty()) out.commands.push_back(describe(*command));
  }
  return out;
}

std::string option_summary(const option_entry& option) {
  const std::string& text = option.description;
  return text.substr(0, std::min({text.find(" ("), text.find(": "), text.find(';'), text.size()}));
}

}  // namespace texts
