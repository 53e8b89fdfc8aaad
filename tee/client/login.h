// Who the client says it is, as far as the system can vouch for it.
#ifndef TEE_CLIENT_LOGIN_H_
#define TEE_CLIENT_LOGIN_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace hosted_tee {

/// login_identity is the identity that the TA sees for a TEEC_LOGIN_* method. Every method but the public one has a
/// name-based (version 5) UUID of what it stands for: the effective user, the group that `connection_data` (a uint32_t)
/// chooses, the path of this program, or two of them. Throws client_failure: TEEC_ERROR_BAD_PARAMETERS for an unknown
/// method or wrong connection data, TEEC_ERROR_ACCESS_DENIED for a group that the process is not in.
[[nodiscard]] TEE_Identity login_identity(std::uint32_t method, const void* connection_data);

}  // namespace hosted_tee

#endif  // TEE_CLIENT_LOGIN_H_
