// How the Client API's own code reports that it can't go on.
#ifndef TEE_CLIENT_CLIENT_FAILURE_H_
#define TEE_CLIENT_CLIENT_FAILURE_H_

#include <cstdint>
#include <exception>

#include "tee_client_api.h"

namespace hosted_tee {

/// A failure that no TA and no TEE is asked about, or that kept them from being asked.
class client_failure : public std::exception {
 public:
  explicit client_failure(TEEC_Result code, std::uint32_t origin = TEEC_ORIGIN_API) : code_(code), origin_(origin) {}
  [[nodiscard]] TEEC_Result code() const { return code_; }
  [[nodiscard]] std::uint32_t origin() const { return origin_; }
  [[nodiscard]] const char* what() const noexcept override { return "the Client API refused"; }

 private:
  TEEC_Result code_;
  std::uint32_t origin_;
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_CLIENT_FAILURE_H_
