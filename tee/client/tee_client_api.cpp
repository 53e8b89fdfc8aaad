// Contexts, sessions and commands of the Client API 1.0 (4.5), embedded form.
#include "tee_client_api.h"

#include <cstring>
#include <new>

#include "tee/client/connection.h"
#include "tee/client/login.h"
#include "tee/client/parameters.h"

namespace hosted_tee {
namespace {

// A result alone does not tell which file is at fault. A device that does not start has no trace, so the line goes
// where KEYMASTER_TRACE has a device's lines printed.
void report(const std::exception& error) noexcept {
  try {
    trace_log().add({"TEE", trace_level::error, "client_api", 0, error.what()});
  } catch (const std::exception&) {
    // The result stands without its line.
  }
}

// The one place where this library's exceptions become results.
template <class Body>
TEEC_Result client_call(Body&& body) noexcept {
  try {
    return body();
  } catch (const client_failure& failure) {
    return failure.code();
  } catch (const world_error& error) {
    report(error);
    return result_of(error.fault());
  } catch (const std::bad_alloc&) {
    return TEEC_ERROR_OUT_OF_MEMORY;
  } catch (const std::exception& error) {
    report(error);
    return TEEC_ERROR_GENERIC;
  }
}

client_context& context_of(const TEEC_Context* context) {
  if (context == nullptr || context->imp == nullptr) throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  return *static_cast<client_context*>(context->imp);
}

client_session& session_of(const TEEC_Session* session) {
  if (session == nullptr || session->imp == nullptr) throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  return *static_cast<client_session*>(session->imp);
}

// Where a result comes from, for a client that wants to know; the API itself until the TEE was asked.
class origin_report {
 public:
  explicit origin_report(std::uint32_t* out) : out_(out) {}
  ~origin_report() {
    if (out_ != nullptr) *out_ = value;
  }
  origin_report(const origin_report&) = delete;
  origin_report& operator=(const origin_report&) = delete;

  std::uint32_t value = TEEC_ORIGIN_API;

 private:
  std::uint32_t* out_;
};

TEE_UUID to_tee(const TEEC_UUID& uuid) {
  static_assert(sizeof(TEE_UUID) == sizeof(TEEC_UUID));
  TEE_UUID out;
  std::memcpy(&out, &uuid, sizeof out);
  return out;
}

}  // namespace

extern "C" {

TEEC_Result TEEC_InitializeContext(const char* name, TEEC_Context* context) {
  return client_call([&]() -> TEEC_Result {
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
  return client_call([&]() -> TEEC_Result {
    if (session == nullptr || destination == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    session->imp = nullptr;
    auto opened = std::make_unique<client_session>(client_session{context_of(context).world, 0});
    const TEE_Identity client = login_identity(connectionMethod, connectionData);
    client_params params(operation);
    const TEE_Result result = opened->world->open_session(to_tee(*destination), client, params.types(), params.slots(),
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
  (void)client_call([&]() -> TEEC_Result {
    closed->world->close_session(closed->number);
    return TEEC_SUCCESS;
  });
}

TEEC_Result TEEC_InvokeCommand(TEEC_Session* session, uint32_t commandID, TEEC_Operation* operation,
                               uint32_t* returnOrigin) {
  origin_report origin(returnOrigin);
  return client_call([&]() -> TEEC_Result {
    const client_session& open = session_of(session);
    client_params params(operation);
    const TEE_Result result = open.world->invoke(open.number, commandID, params.types(), params.slots(), origin.value);
    params.hand_back();
    return result;
  });
}

// No TA of this system unmasks cancellation, and a masked request has no effect.
void TEEC_RequestCancellation(TEEC_Operation* /*operation*/) {}

}  // extern "C"
}  // namespace hosted_tee
