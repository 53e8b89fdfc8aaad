// Auth tokens, as far as who carries them may look into them: only the secure world can tell a true one.
#ifndef KEYMASTER_CLIENT_LIB_AUTH_TOKEN_H_
#define KEYMASTER_CLIENT_LIB_AUTH_TOKEN_H_

#include <cstdint>

#include "client/lib/bytes.h"

namespace keymaster::client {

inline constexpr std::size_t auth_token_size = 69;

/// What a token says.
struct auth_token {
  std::uint64_t challenge = 0;  ///< the operation that it is for; 0 for none
  std::uint64_t secure_id = 0;  ///< the user
  std::uint64_t authenticator_id = 0;
  std::uint32_t type = 0;          ///< of auth_type_names: 1 password, 2 fingerprint
  std::uint64_t timestamp_ms = 0;  ///< system time at which it was made
};

/// parse_auth_token reads a token. Throws format_error for another size or version.
[[nodiscard]] auth_token parse_auth_token(byte_view token);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_AUTH_TOKEN_H_
