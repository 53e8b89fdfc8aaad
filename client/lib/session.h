// The way to the TA: a connection to a TEE, a session with the Keymaster TA, and one call that carries out a command.
#ifndef KEYMASTER_CLIENT_LIB_SESSION_H_
#define KEYMASTER_CLIENT_LIB_SESSION_H_

#include <cstdint>
#include <optional>
#include <string>

#include "client/lib/bytes.h"
#include "client/lib/error.h"
#include "src/params/keymaster_protocol.h"
#include "tee_client_api.h"

namespace keymaster::client {

/// A connection to a TEE. Its sessions must end before it does.
class connection {
 public:
  /// Connects to the TEE called `name` ("embedded:FOLDER"); an empty name takes the default one. Throws error with
  /// error_kind::connection and the result of TEEC_InitializeContext.
  explicit connection(const std::string& name = {});
  connection(const connection&) = delete;
  connection& operator=(const connection&) = delete;
  ~connection() { TEEC_FinalizeContext(&context_); }

  [[nodiscard]] TEEC_Context& context() { return context_; }

 private:
  TEEC_Context context_{};
};

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
  session(const session&) = delete;
  session& operator=(const session&) = delete;
  ~session() { TEEC_CloseSession(&session_); }

  /// call carries out a command whose slot 0 answers the Keymaster error in `a`. Throws error with error_kind::tee when
  /// the TEE result is not TEE_SUCCESS, and with error_kind::keymaster when the Keymaster error is not KM_ERROR_OK.
  reply call(const invocation& what);

  /// call_plain carries out a command that does not answer a Keymaster error. Throws error with error_kind::tee.
  reply call_plain(const invocation& what);

 private:
  TEEC_Session session_{};
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_SESSION_H_
