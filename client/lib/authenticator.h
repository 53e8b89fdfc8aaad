// The password authenticator: users' passwords become handles, which the caller keeps, and then auth tokens.
#ifndef KEYMASTER_CLIENT_LIB_AUTHENTICATOR_H_
#define KEYMASTER_CLIENT_LIB_AUTHENTICATOR_H_

#include <cstdint>
#include <optional>

#include "client/lib/bytes.h"
#include "client/lib/ta_session.h"

namespace keymaster::client {

/// What an enrolment gives: the handle, which is worth nothing without the TA, and the user's secure id, which keys are
/// bound to.
struct enrolment {
  bytes handle;
  std::uint64_t secure_id = 0;
};

/// What the user has now.
struct present_password {
  byte_view handle;
  byte_view password;
};

/// A session with the authenticator. Every call throws error with error_kind::companion when the TA refuses it, and
/// format_error when its answer is malformed. Passwords are overwritten in every copy that is made of them here.
///
/// TEEC_ERROR_ACCESS_DENIED: the password is wrong, or the handle is not one of this user on this device.
/// TEEC_ERROR_BUSY: too many wrong passwords; facts().wait_ms tells for how long every password is refused.
class authenticator {
 public:
  /// Opens the session. Throws error with error_kind::connection.
  explicit authenticator(connection& tee);

  /// enrol makes a handle for a user's password. Without `present` the user gets a new secure id, and keys that are
  /// bound to another stay shut; with it the password is changed and the secure id kept. TEEC_ERROR_BAD_PARAMETERS for
  /// a password that is empty or longer than authenticator::password_limit.
  [[nodiscard]] enrolment enrol(std::uint32_t uid, byte_view password,
                                const std::optional<present_password>& present = {});

  /// verify turns the password into an auth token that says `challenge`, see auth_token.h.
  [[nodiscard]] bytes verify(std::uint32_t uid, std::uint64_t challenge, byte_view handle, byte_view password);

 private:
  ta_session session_;
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_AUTHENTICATOR_H_
