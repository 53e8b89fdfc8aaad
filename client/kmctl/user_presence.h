// Users who prove during a command that they are there: by a touch of the sensor, or by their password.
#ifndef KEYMASTER_CLIENT_KMCTL_USER_PRESENCE_H_
#define KEYMASTER_CLIENT_KMCTL_USER_PRESENCE_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "client/kmctl/command_line.h"
#include "client/kmctl/password.h"
#include "client/kmctl/waiting.h"
#include "client/lib/authorizations.h"
#include "client/lib/connection.h"

namespace kmctl {

/// Collects --finger, and --auth-handle with --auth-uid and --password-file.
class presence_options {
 public:
  void add_to(command_line& command);

  /// The files that a command reads for them, in which one "-" at most may be.
  [[nodiscard]] std::vector<std::string> files() const;

  [[nodiscard]] bool given() const { return finger_.has_value() || !handle_.empty(); }

 private:
  friend class user_presence;

  std::optional<std::uint32_t> finger_;
  std::string handle_;
  std::optional<std::uint32_t> uid_;
  password_option password_;
  waiting_option waiting_;
};

/// A user during one operation. What the key asks for decides when the token is made: a key with an authentication
/// timeout takes one before the operation begins, another key one that names the operation. The password gives the
/// token where there is one, and else the finger. For an attested key the finger also goes into the statement, and so
/// touches after the operation has begun: the Keymaster TA believes no finger before it has loaded what begin loads.
class user_presence {
 public:
  /// Reads the handle, and the password or asks for it. Throws usage_error, failure_error. Connection and options must
  /// outlive this.
  user_presence(keymaster::client::connection& tee, const presence_options& options);

  /// suit learns what the operation needs from the key's characteristics. Throws usage_error when it needs no user, or
  /// when a token was given besides.
  void suit(keymaster::keymaster_purpose_t purpose, const keymaster::client::authorizations& characteristics,
            bool tokens_given);

  /// before_begin gives what begin is told, and after_begin what update and finish are told of the operation `handle`.
  /// Both throw keymaster::client::error; after_begin also failure_error when the Keymaster TA does not believe a
  /// finger that goes into a statement.
  [[nodiscard]] keymaster::client::authorizations before_begin();
  [[nodiscard]] keymaster::client::authorizations after_begin(std::uint32_t handle);

 private:
  [[nodiscard]] keymaster::client::authorizations token(std::uint64_t challenge);
  [[nodiscard]] keymaster::client::bytes touch(std::uint64_t challenge);

  keymaster::client::connection& tee_;
  const presence_options& options_;
  keymaster::client::bytes handle_;
  secret_bytes password_;
  std::uint32_t answer_to_touch_ = 0;  ///< what the Keymaster TA said when it was told of the finger
  bool token_before_ = false;
  bool token_after_ = false;
  bool finger_in_statement_ = false;
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_USER_PRESENCE_H_
