#include "client/lib/authenticator.h"

#include "client/lib/auth_token.h"
#include "client/lib/wire.h"
#include "tee/companions/authenticator/authenticator_protocol.h"

namespace keymaster::client {
namespace {

namespace protocol = keymaster::authenticator;

constexpr TEEC_UUID this_ta = AUTHENTICATOR_TA_UUID;

/// Carries out a command whose refusal for the time being is told in the slot `waiting`.
void call(ta_session& session, const char* step, std::uint32_t command, slots& parameters, std::size_t waiting) {
  try {
    session.call(step, command, parameters);
  } catch (const error& refused) {
    failure facts = refused.facts();
    if (facts.tee_result != TEEC_ERROR_BUSY || facts.tee_origin != TEEC_ORIGIN_TRUSTED_APP) {
      throw;  // the TEE itself can be busy, and then nobody has set the slot
    }
    facts.wait_ms = parameters[waiting].value().a;
    throw error(std::move(facts));
  }
}

/// A request for so many bytes of fields, none of which it leaves behind in memory.
secret_bytes request_for(std::size_t fields) {
  secret_bytes request;
  request.reserve(fields + std::size_t{3} * 8);
  return request;
}

}  // namespace

authenticator::authenticator(connection& tee) : session_(tee, this_ta, "open_authenticator") {}

enrolment authenticator::enrol(std::uint32_t uid, byte_view password, const std::optional<present_password>& present) {
  const present_password old = present.value_or(present_password{});
  secret_bytes request = request_for(old.handle.size() + old.password.size() + password.size());
  append_block(request, old.handle);
  append_block(request, old.password);
  append_block(request, password);
  bytes handle(protocol::handle_size);
  slots parameters{slot::value_in(uid), slot::bytes_in(request), slot::bytes_out(handle), slot::value_out()};
  call(session_, "enrol_password", protocol::COMMAND_ENROL, parameters, 3);
  if (parameters[2].size() != handle.size()) {
    throw format_error("a password's handle has " + std::to_string(handle.size()) + " bytes, not " +
                       std::to_string(parameters[2].size()));
  }
  const std::uint64_t secure_id = parameters[3].number();
  if (secure_id == 0) {
    throw format_error("the authenticator gives a user the secure id 0, which stands for nobody");
  }
  return {.handle = std::move(handle), .secure_id = secure_id};
}

bytes authenticator::verify(std::uint32_t uid, std::uint64_t challenge, byte_view handle, byte_view password) {
  secret_bytes request = request_for(handle.size() + password.size());
  append_number(request, challenge, 8);
  append_block(request, handle);
  append_block(request, password);
  bytes token(auth_token_size);
  slots parameters{slot::value_inout(uid), slot::bytes_in(request), slot::bytes_out(token)};
  call(session_, "verify_password", protocol::COMMAND_VERIFY, parameters, 0);
  token.resize(parameters[2].size());
  (void)parse_auth_token(token);
  return token;
}

}  // namespace keymaster::client
