// From a context's name to the device behind it.
#ifndef TEE_CLIENT_CONNECTION_H_
#define TEE_CLIENT_CONNECTION_H_

#include <memory>

#include "tee/runtime/secure_world.h"
#include "tee_client_api.h"

namespace hosted_tee {

/// What TEEC_Context.imp points at.
struct client_context {
  std::shared_ptr<secure_world> world;
};

/// What TEEC_Session.imp points at.
struct client_session {
  std::shared_ptr<secure_world> world;
  std::uint32_t number;
};

/// A failure of the Client API itself, before a TA or the TEE was asked.
class client_failure : public std::exception {
 public:
  explicit client_failure(TEEC_Result code) : code_(code) {}
  [[nodiscard]] TEEC_Result code() const { return code_; }
  [[nodiscard]] const char* what() const noexcept override { return "the Client API refused"; }

 private:
  TEEC_Result code_;
};

/// connect finds or starts the device that `name` stands for, as TEEC_InitializeContext documents it. Throws
/// client_failure, with TEEC_ERROR_GENERIC when there is no default folder, or world_error.
[[nodiscard]] std::shared_ptr<secure_world> connect(const char* name);

/// result_of is the result that a device which can't be used has in the Client API.
[[nodiscard]] TEEC_Result result_of(world_fault fault);

}  // namespace hosted_tee

#endif  // TEE_CLIENT_CONNECTION_H_
