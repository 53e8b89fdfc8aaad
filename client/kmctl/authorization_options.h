// The options that describe a key or an operation, under the names of their tags.
#ifndef KEYMASTER_CLIENT_KMCTL_AUTHORIZATION_OPTIONS_H_
#define KEYMASTER_CLIENT_KMCTL_AUTHORIZATION_OPTIONS_H_

#include <string>
#include <vector>

#include "client/kmctl/command_line.h"
#include "client/lib/authorizations.h"
#include "client/lib/keys.h"

namespace kmctl {

/// Where an option is offered: on keys that are made or imported, on signatures and MACs, on ciphers.
enum class option_use : unsigned { generate = 1, import = 2, operation = 4, cipher = 8 };

/// Collects --algorithm, --digest, --usage-expire and their like into authorizations.
class authorization_options {
 public:
  /// add_to offers the options for `use` on a sub-command. This object must live as long as the sub-command.
  void add_to(command_line& command, option_use use);

  /// What was given, in the order of the options' table.
  [[nodiscard]] const keymaster::client::authorizations& given() const { return given_; }
  /// The files that it came from.
  [[nodiscard]] const std::vector<std::string>& files() const { return files_; }

 private:
  keymaster::client::authorizations given_;
  std::vector<std::string> files_;
};

/// Collects --app-id and --app-data.
class application_options {
 public:
  void add_to(command_line& command);
  [[nodiscard]] const keymaster::client::application& given() const { return given_; }
  /// The files that it came from.
  [[nodiscard]] const std::vector<std::string>& files() const { return files_; }

 private:
  keymaster::client::application given_;
  std::vector<std::string> files_;
};

/// with_defaults completes the description of a new key: what `stated` leaves out is filled with what suits its
/// algorithm (RSA when it names none) and the use that is known, so that an empty description is a sound key. A key
/// that is imported brings its own size and exponent, which stay out. Without a user's id the key needs no
/// authentication. Throws usage_error for an attested key that would be worthless, see attested_key.h.
[[nodiscard]] keymaster::client::authorizations with_defaults(const keymaster::client::authorizations& stated,
                                                              option_use use);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_AUTHORIZATION_OPTIONS_H_
