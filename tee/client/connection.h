// From a context's name to the TEE behind it.
#ifndef TEE_CLIENT_CONNECTION_H_
#define TEE_CLIENT_CONNECTION_H_

#include <memory>

#include "tee/client/tee_link.h"
#include "tee/runtime/secure_world.h"

namespace hosted_tee {

/// What TEEC_Context.imp points at.
struct client_context {
  std::shared_ptr<tee_link> tee;
};

/// What TEEC_Session.imp points at.
struct client_session {
  std::shared_ptr<tee_link> tee;
  std::uint32_t number;
};

/// connect finds or starts the device that `name` stands for, or connects to its server, as TEEC_InitializeContext
/// documents it. Throws client_failure, with TEEC_ERROR_GENERIC when there is no default folder, or world_error.
[[nodiscard]] std::shared_ptr<tee_link> connect(const char* name);

/// result_of is the result that a device which can't be used has in the Client API.
[[nodiscard]] TEEC_Result result_of(world_fault fault);

}  // namespace hosted_tee

#endif  // TEE_CLIENT_CONNECTION_H_
