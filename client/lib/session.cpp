#include "client/lib/session.h"

#include <algorithm>

#include "client/lib/names.h"
#include "src/params/keymaster_defs.h"

namespace keymaster::client {
namespace {

constexpr TEEC_UUID keymaster_ta = KEYMASTER_TA_UUID;

/// The Keymaster error that goes with a TEE error. A refusal before the handler leaves the word as the client sent it,
/// and then there is no Keymaster error.
std::int32_t error_beside_result(const invocation& what, std::uint32_t a) {
  return a == what.a ? std::int32_t{KM_ERROR_OK} : static_cast<std::int32_t>(a);
}

}  // namespace

connection::connection(const std::string& name) {
  const TEEC_Result result = TEEC_InitializeContext(name.empty() ? nullptr : name.c_str(), &context_);
  if (result != TEEC_SUCCESS) {
    throw error(
        {.kind = error_kind::connection, .step = "connect", .tee_result = result, .tee_origin = TEEC_ORIGIN_API});
  }
}

session::session(connection& tee) {
  std::uint32_t origin = 0;
  const TEEC_Result result =
      TEEC_OpenSession(&tee.context(), &session_, &keymaster_ta, TEEC_LOGIN_PUBLIC, nullptr, nullptr, &origin);
  if (result != TEEC_SUCCESS) {
    throw error({.kind = error_kind::connection, .step = "open_session", .tee_result = result, .tee_origin = origin});
  }
}

reply session::call_plain(const invocation& what) {
  TEEC_Operation operation{};
  reply answer;
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, what.request ? TEEC_MEMREF_TEMP_INPUT : TEEC_NONE,
                                          what.response_capacity ? TEEC_MEMREF_TEMP_OUTPUT : TEEC_NONE, TEEC_NONE);
  operation.params[0].value = {.a = what.a, .b = what.b};
  if (what.request) {
    // The standard's structure serves both directions and so has no const; an input buffer is only read.
    operation.params[1].tmpref = {.buffer = const_cast<std::uint8_t*>(what.request->data()),
                                  .size = what.request->size()};
  }
  if (what.response_capacity) {
    answer.body.resize(*what.response_capacity);
    operation.params[2].tmpref = {.buffer = answer.body.data(), .size = answer.body.size()};
  }
  std::uint32_t origin = 0;
  const TEEC_Result result = TEEC_InvokeCommand(&session_, what.command, &operation, &origin);
  answer.a = operation.params[0].value.a;
  answer.b = operation.params[0].value.b;
  if (result != TEEC_SUCCESS) {
    throw error({.kind = error_kind::tee,
                 .step = command_name(what.command),
                 .tee_result = result,
                 .tee_origin = origin,
                 .keymaster_error = error_beside_result(what, answer.a)});
  }
  if (what.response_capacity) {
    answer.body.resize(std::min(operation.params[2].tmpref.size, answer.body.size()));
  }
  return answer;
}

reply session::call(const invocation& what) {
  reply answer = call_plain(what);
  if (const auto keymaster_error = static_cast<std::int32_t>(answer.a); keymaster_error != KM_ERROR_OK) {
    throw error({.kind = error_kind::keymaster,
                 .step = command_name(what.command),
                 .tee_result = TEEC_SUCCESS,
                 .tee_origin = TEEC_ORIGIN_TRUSTED_APP,
                 .keymaster_error = keymaster_error});
  }
  return answer;
}

}  // namespace keymaster::client
