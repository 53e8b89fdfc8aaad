// The identity that a TA sees of a client, from what the system vouches for.
#ifndef TEE_RUNTIME_CLIENT_IDENTITY_H_
#define TEE_RUNTIME_CLIENT_IDENTITY_H_

#include <cstdint>
#include <optional>
#include <string>

#include "tee_api_types.h"

namespace hosted_tee {

/// What a login method stands for.
struct login_method {
  std::uint32_t number;  ///< TEEC_LOGIN_*
  bool user;
  bool group;
  bool application;
};

/// find_login_method answers nothing for a number that no client can log in with.
[[nodiscard]] std::optional<login_method> find_login_method(std::uint32_t number);

/// Who a client is. What the method does not stand for does not count.
struct client_facts {
  std::uint32_t user = 0;
  std::uint32_t group = 0;
  std::string application;  ///< the path of the program
};

/// identity_of is the name-based (version 5) UUID of what the method stands for; the public login has none.
[[nodiscard]] TEE_Identity identity_of(const login_method& method, const client_facts& client);

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_CLIENT_IDENTITY_H_
