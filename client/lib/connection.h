// A connection to a TEE.
#ifndef KEYMASTER_CLIENT_LIB_CONNECTION_H_
#define KEYMASTER_CLIENT_LIB_CONNECTION_H_

#include <string>

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

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_CONNECTION_H_
