// Calls to another TA (Internal Core API 1.1.2, 4.9).
#include "tee/runtime/device.h"
#include "tee/runtime/platform_call.h"

namespace hosted_tee {
namespace {

session_service& other_tas(const instance& self) {
  if (self.device.other_tas == nullptr) throw call_failure(TEE_ERROR_ITEM_NOT_FOUND);
  return *self.device.other_tas;
}

TEE_Result open_session(instance& self, const TEE_UUID& destination, std::uint32_t types, TEE_Param* params,
                        TEE_TASessionHandle* handle, std::uint32_t& origin) {
  // The handle comes first: a session that is open already could not be given back for want of memory.
  TEE_TASessionHandle made = self.sessions.insert(std::make_unique<std::uint32_t>(0));
  const TEE_Identity caller{TEE_LOGIN_TRUSTED_APP, self.uuid};
  const TEE_Result result =
      other_tas(self).open_nested(destination, caller, types, params, *self.sessions.find(made), origin);
  if (result == TEE_SUCCESS) {
    *handle = made;
  } else {
    self.sessions.erase(made);
  }
  return result;
}

std::uint32_t session_of(const instance& self, TEE_TASessionHandle handle) {
  const std::uint32_t* session = self.sessions.find(handle);
  if (session == nullptr) panic("the handle is not that of a session to another TA");
  return *session;
}

// A caller that does not want to know the origin passes null.
void tell_origin(std::uint32_t* wanted, std::uint32_t origin) {
  if (wanted != nullptr) *wanted = origin;
}

}  // namespace

extern "C" {

TEE_Result TEE_OpenTASession(const TEE_UUID* destination, uint32_t /*cancellationRequestTimeout*/, uint32_t paramTypes,
                             TEE_Param params[4], TEE_TASessionHandle* session, uint32_t* returnOrigin) {
  if (session != nullptr) *session = TEE_HANDLE_NULL;
  tell_origin(returnOrigin, TEE_ORIGIN_API);
  return platform_call("TEE_OpenTASession", nullptr, [&](instance& self) {
    if (destination == nullptr || session == nullptr) panic("destination or session is null");
    std::uint32_t origin = TEE_ORIGIN_API;
    const TEE_Result result = open_session(self, *destination, paramTypes, params, session, origin);
    tell_origin(returnOrigin, origin);
    return result;
  });
}

void TEE_CloseTASession(TEE_TASessionHandle session) {
  platform_call_void("TEE_CloseTASession", [&](instance& self) {
    if (session == TEE_HANDLE_NULL) return;
    const std::uint32_t number = session_of(self, session);
    self.sessions.erase(session);
    other_tas(self).close_nested(number);
  });
}

TEE_Result TEE_InvokeTACommand(TEE_TASessionHandle session, uint32_t /*cancellationRequestTimeout*/, uint32_t commandID,
                               uint32_t paramTypes, TEE_Param params[4], uint32_t* returnOrigin) {
  tell_origin(returnOrigin, TEE_ORIGIN_API);
  return platform_call("TEE_InvokeTACommand", nullptr, [&](const instance& self) {
    std::uint32_t origin = TEE_ORIGIN_API;
    const TEE_Result result =
        other_tas(self).invoke_nested(session_of(self, session), commandID, paramTypes, params, origin);
    tell_origin(returnOrigin, origin);
    return result;
  });
}

}  // extern "C"
}  // namespace hosted_tee
