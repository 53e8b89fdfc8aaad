// Who the client says it is, as far as the system can vouch for it.
#ifndef TEE_CLIENT_LOGIN_H_
#define TEE_CLIENT_LOGIN_H_

#include <cstdint>

#include "tee/runtime/client_identity.h"
#include "tee_internal_api.h"

namespace hosted_tee {

/// checked_login_method finds the method of a session. Throws client_failure: TEEC_ERROR_BAD_PARAMETERS for an unknown
/// method, connection data that it does not take, or none where it takes a group (a uint32_t).
[[nodiscard]] login_method checked_login_method(std::uint32_t method, const void* connection_data);

/// login_identity is the identity that the TA sees of this process: of its effective user, the group that
/// `connection_data` chooses, its program, or two of them. Throws as checked_login_method, and
/// TEEC_ERROR_ACCESS_DENIED for a group that the process is not in.
[[nodiscard]] TEE_Identity login_identity(std::uint32_t method, const void* connection_data);

}  // namespace hosted_tee

#endif  // TEE_CLIENT_LOGIN_H_
