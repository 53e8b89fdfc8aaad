// Contexts, sessions and commands of the Client API 1.0 (4.5).
#include "tee_client_api.h"

#include <cstring>

#include "tee/client/call.h"
#include "tee/client/connection.h"
#include "tee/client/login.h"
#include "tee/client/parameters.h"

namespace hosted_tee {

// A result alone does not tell which file is at fault. A device that does not start has no trace, so the line goes
// where KEYMASTER_TRACE has a device's lines printed.
void report(const std::exception& error) noexcept {
  try {
    trace_log().add({"TEE", trace_level::error, "client_api", 0, error.what()});
  } catch (const std::exception&) {
    // The result stands without its line.
  }
}

namespace {

client_context& context_of(const TEEC_Context* context) {
  if (context == nullptr || context->imp == nullptr) throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  return *static_cast<client_context*>(context->imp);
}

// By value: should the client close the session meanwhile, the call does not end in freed memory.
client_session session_of(const TEEC_Session* session) {
  if (session == nullptr || session->imp == nullptr) throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  return *static_cast<client_session*>(session->imp);
}

TEE_UUID to_tee(const TEEC_UUID& uuid) {
  static_assert(sizeof(TEE_UUID) == sizeof(TEEC_UUID));
  TEE_UUID out;
  std::memcpy(&out, &uuid, sizeof out);
  return out;
}

}  // namespace

extern "C" {

TEEC_Result TEEC_InitializeContext(const char* name, TEEC_Context* context) {
  return client_call(nullptr, [&]() -> TEEC_Result {
    if (context == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    context->imp = nullptr;
    context->imp = new client_context{connect(name)};
    return TEEC_SUCCESS;
  });
}

void TEEC_FinalizeContext(TEEC_Context* context) {
  if (context == nullptr) return;
  delete static_cast<client_context*>(context->imp);
  context->imp = nullptr;
}

TEEC_Result TEEC_OpenSession(TEEC_Context* context, TEEC_Session* session, const TEEC_UUID* destination,
                             uint32_t connectionMethod, const void* connectionData, TEEC_Operation* operation,
                             uint32_t* returnOrigin) {
  origin_report origin(returnOrigin);
  return client_call(&origin, [&]() -> TEEC_Result {
    if (session == nullptr || destination == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    session->imp = nullptr;
    auto opened = std::make_unique<client_session>(client_session{context_of(context).tee, 0});
    (void)checked_login_method(connectionMethod, connectionData);
    client_params params(operation, *opened->tee);
    const TEEC_Result result = opened->tee->open_session(to_tee(*destination), connectionMethod, connectionData, params,
                                                         opened->number, origin.value);
    params.hand_back();
    if (result == TEE_SUCCESS) session->imp = opened.release();
    return result;
  });
}

void TEEC_CloseSession(TEEC_Session* session) {
  if (session == nullptr || session->imp == nullptr) return;
  const std::unique_ptr<client_session> closed(static_cast<client_session*>(session->imp));
  session->imp = nullptr;
  (void)client_call(nullptr, [&]() -> TEEC_Result {
    closed->tee->close_session(closed->number);
    return TEEC_SUCCESS;
  });
}

TEEC_Result TEEC_InvokeCommand(TEEC_Session* session, uint32_t commandID, TEEC_Operation* operation,
                               uint32_t* returnOrigin) {
  origin_report origin(returnOrigin);
  return client_call(&origin, [&]() -> TEEC_Result {
    const client_session open = session_of(session);
    client_params params(operation, *open.tee);
    const TEEC_Result result = open.tee->invoke(open.number, commandID, params, origin.value);
    params.hand_back();
    return result;
  });
}

// No TA of this system unmasks cancellation, and a masked request has no effect.
void TEEC_RequestCancellation(TEEC_Operation* /*operation*/) {}

}  // extern "C"
}  // namespace hosted_tee
