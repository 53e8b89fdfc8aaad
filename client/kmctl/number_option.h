// Options and arguments that are one number.
#ifndef KEYMASTER_CLIENT_KMCTL_NUMBER_OPTION_H_
#define KEYMASTER_CLIENT_KMCTL_NUMBER_OPTION_H_

#include <concepts>
#include <limits>
#include <string>

#include "client/kmctl/command_line.h"
#include "client/kmctl/values.h"

namespace kmctl {

/// add_number adds an option or, for a name without dashes, an argument that parse_number reads into `number`, which
/// must live as long as the command.
template <std::unsigned_integral Number>
option add_number(command_line& command, const std::string& name, Number& number, const std::string& help) {
  const auto take = [&number](const std::string& text) {
    number = static_cast<Number>(parse_number(text, std::numeric_limits<Number>::max()));
  };
  return command.add_option_function(name, take, help).type_name(name.starts_with('-') ? "NUMBER" : "");
}

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_NUMBER_OPTION_H_
