// The way to the Keymaster TA: a session with it, and calls that carry out a command.
#ifndef KEYMASTER_CLIENT_LIB_SESSION_H_
#define KEYMASTER_CLIENT_LIB_SESSION_H_

#include <cstdint>
#include <optional>

#include "client/lib/bytes.h"
#include "client/lib/connection.h"
#include "client/lib/error.h"
#include "client/lib/ta_session.h"
#include "src/params/keymaster_protocol.h"

namespace keymaster::client {

/// What goes into one command: the two words of slot 0, the request body, and how many bytes the response may have. A
/// body that the command does not have stays absent, which is not the same as empty.
struct invocation {
  keymaster_command_t command;
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  std::optional<byte_view> request = {};
  std::optional<std::size_t> response_capacity = {};
};

/// What comes back: the two words of slot 0 and the response body.
struct reply {
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  bytes body;
};

/// A session with the Keymaster TA. One session serves any number of keys and operations, one call at a time.
class session {
 public:
  /// Opens a session. Throws error with error_kind::connection.
  explicit session(connection& tee);

  /// call carries out a command whose slot 0 answers the Keymaster error in `a`. Throws error with error_kind::tee when
  /// the TEE result is not TEE_SUCCESS, and with error_kind::keymaster when the Keymaster error is not KM_ERROR_OK.
  reply call(const invocation& what);

  /// call_plain carries out a command that does not answer a Keymaster error. Throws error with error_kind::tee.
  reply call_plain(const invocation& what);

  /// call_soter carries out a command of the attestation's, whose slot 0 answers a status. Throws error with
  /// error_kind::tee, and with error_kind::soter when the status is not SOTER_STATUS_OK.
  reply call_soter(const invocation& what);

 private:
  reply carry_out(const invocation& what, const slot& words);

  ta_session session_;
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_SESSION_H_
