#include "client/lib/connection.h"

#include "client/lib/error.h"

namespace keymaster::client {

connection::connection(const std::string& name) {
  const TEEC_Result result = TEEC_InitializeContext(name.empty() ? nullptr : name.c_str(), &context_);
  if (result != TEEC_SUCCESS) {
    throw error(
        {.kind = error_kind::connection, .step = "connect", .tee_result = result, .tee_origin = TEEC_ORIGIN_API});
  }
}

}  // namespace keymaster::client
