#include "client/kmctl/command_line.h"

#include <CLI/CLI.hpp>
#include <utility>

namespace kmctl {

option option::type_name(const std::string& word) const {
  return option(*made_->type_name(word));
}

option option::group(const std::string& heading) const {
  return option(*made_->group(heading));
}

option option::required() const {
  return option(*made_->required());
}

option option::needs(option other) const {
  return option(*made_->needs(other.made_));
}

option option::excludes(option other) const {
  return option(*made_->excludes(other.made_));
}

option option::one_of(const std::vector<std::string>& words) const {
  return option(*made_->check(CLI::IsMember(words)));
}

option option::capture_default() const {
  return option(*made_->capture_default_str());
}

option option::join(char between) const {
  return option(*made_->join(between));
}

option option::take_last() const {
  return option(*made_->multi_option_policy(CLI::MultiOptionPolicy::TakeLast));
}

option option::trigger_on_parse() const {
  return option(*made_->trigger_on_parse());
}

bool option::is_given() const {
  return !made_->empty();
}

bool option::is_required() const {
  return made_->get_required();
}

const std::string& option::value() const {
  return made_->results().back();
}

option command_line::add_option(const std::string& name, std::string& value, const std::string& help) {
  return option(*app_.add_option(name, value, help));
}

option command_line::add_option(const std::string& name, std::optional<std::string>& value, const std::string& help) {
  return option(*app_.add_option(name, value, help));
}

option command_line::add_option_function(const std::string& name, const std::function<void(const std::string&)>& take,
                                         const std::string& help) {
  return option(*app_.add_option_function<std::string>(name, take, help));
}

option command_line::add_flag(const std::string& name, bool& is_given, const std::string& help) {
  return option(*app_.add_flag(name, is_given, help));
}

option command_line::add_flag_callback(const std::string& name, std::function<void()> take, const std::string& help) {
  return option(*app_.add_flag_callback(name, std::move(take), help));
}

void command_line::footer(const std::string& text) {
  app_.footer(text);
}

command_line command_line::add_subcommand(const std::string& name, const std::string& description) {
  CLI::App& added = *app_.add_subcommand(name, description);
  added.fallthrough();
  return command_line(added);
}

void command_line::require_subcommand() {
  app_.require_subcommand(1);
}

void command_line::when_met(std::function<void()> act) {
  app_.preparse_callback([act = std::move(act)](std::size_t /*arguments*/) { act(); });
}

void command_line::when_read(std::function<void()> act) {
  app_.final_callback(std::move(act));
}

}  // namespace kmctl
