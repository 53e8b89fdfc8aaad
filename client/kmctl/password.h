// Passwords: from a file, or asked for on the terminal. They are never arguments, which everybody on the machine sees.
#ifndef KEYMASTER_CLIENT_KMCTL_PASSWORD_H_
#define KEYMASTER_CLIENT_KMCTL_PASSWORD_H_

#include <string>

#include "client/kmctl/command_line.h"
#include "client/lib/bytes.h"

namespace kmctl {

using keymaster::client::secret_bytes;

/// read_password_file reads a password from a file; line ends at its end don't belong to it. Throws failure_error, also
/// when nothing is left.
[[nodiscard]] secret_bytes read_password_file(const std::string& path);

/// ask_password asks for a password on the controlling terminal, which shows nothing of it. Throws usage_error when
/// there is no such terminal, and failure_error when the answer is empty or can't be read.
[[nodiscard]] secret_bytes ask_password(const std::string& prompt);

/// An option that names a password's file.
class password_option {
 public:
  option add_to(command_line& command, const std::string& flag, const std::string& help);

  /// The file, empty without one; among a command's inputs.
  [[nodiscard]] const std::string& file() const { return file_; }

  /// read reads the file, or asks when none was given; read_new asks twice. Throw what read_password_file and
  /// ask_password throw; read_new throws failure_error when the two answers differ.
  [[nodiscard]] secret_bytes read(const std::string& prompt) const;
  [[nodiscard]] secret_bytes read_new(const std::string& prompt) const;

 private:
  std::string file_;
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_PASSWORD_H_
