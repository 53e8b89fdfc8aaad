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

session::session(connection& tee) : session_(tee, keymaster_ta, "open_session") {}

reply session::carry_out(const invocation& what, const slot& words) {
  reply answer;
  slots parameters{words};
  if (what.request) {
    parameters[1] = slot::bytes_in(*what.request);
  }
  if (what.response_capacity) {
    answer.body.resize(*what.response_capacity);
    parameters[2] = slot::bytes_out(answer.body);
  }
  const outcome done = session_.invoke(what.command, parameters);
  answer.a = parameters[0].value().a;
  answer.b = parameters[0].value().b;
  if (done.result != TEEC_SUCCESS) {
    throw error({.kind = error_kind::tee,
                 .step = command_name(what.command),
                 .tee_result = done.result,
                 .tee_origin = done.origin,
                 .keymaster_error = error_beside_result(what, answer.a)});
  }
  if (what.response_capacity) {
    answer.body.resize(std::min(parameters[2].size(), answer.body.size()));
  }
  return answer;
}

reply session::call_plain(const invocation& what) {
  return carry_out(what, slot::value_inout(what.a, what.b));
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

reply session::call_soter(const invocation& what) {
  // Those that write a response take no words.
  reply answer = carry_out(what, what.response_capacity ? slot::value_out() : slot::value_inout(what.a, what.b));
  if (const auto status = static_cast<std::int32_t>(answer.a); status != SOTER_STATUS_OK) {
    throw error({.kind = error_kind::soter,
                 .step = command_name(what.command),
                 .tee_result = TEEC_SUCCESS,
                 .tee_origin = TEEC_ORIGIN_TRUSTED_APP,
                 .soter_status = status});
  }
  return answer;
}

}  // namespace keymaster::client
