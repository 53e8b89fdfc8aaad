// The options that describe a key or an operation, under the names of their tags.
#ifndef KEYMASTER_CLIENT_KMCTL_AUTHORIZATION_OPTIONS_H_
#define KEYMASTER_CLIENT_KMCTL_AUTHORIZATION_OPTIONS_H_

#include <CLI/CLI.hpp>
#include <string>

#include "client/lib/authorizations.h"
#include "client/lib/keys.h"

namespace kmctl {

/// Where an option is offered.
enum class option_use : unsigned { generate = 1, import = 2, operation = 4 };

/// Collects --algorithm, --digest, --usage-expire and their like into authorizations.
class authorization_options {
 public:
  /// add_to offers the options for `use` on a sub-command. This object must live as long as the sub-command.
  void add_to(CLI::App& command, option_use use);

  /// What was given, in the order of the options' table.
  [[nodiscard]] const keymaster::client::authorizations& given() const { return given_; }

 private:
  keymaster::client::authorizations given_;
};

/// Collects --app-id and --app-data.
class application_options {
 public:
  void add_to(CLI::App& command);
  [[nodiscard]] const keymaster::client::application& given() const { return given_; }

 private:
  keymaster::client::application given_;
};

/// with_defaults completes the description of a new key: what `given` leaves out is filled with what suits its
/// algorithm (RSA when it names none), so that an empty description is a sound key. A key that is imported brings its
/// own size and exponent, which stay out. Without a user's id the key needs no authentication.
[[nodiscard]] keymaster::client::authorizations with_defaults(const keymaster::client::authorizations& given,
                                                              option_use use);

/// operation_parameters gives what begin needs for a key with these characteristics: the given padding, digest and MAC
/// length, and where one is missing the only one that the key allows. Throws usage_error when there is a choice.
[[nodiscard]] keymaster::client::authorizations operation_parameters(
    const keymaster::client::authorizations& given, const keymaster::client::authorizations& characteristics);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_AUTHORIZATION_OPTIONS_H_
