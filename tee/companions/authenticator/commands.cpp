// The commands of the password authenticator.
#include "platform/byte_order.h"
#include "platform/bytes.h"
#include "platform/cursor.h"
#include "platform/trace.h"
#include "tee/companions/authenticator/authenticator_protocol.h"
#include "tee/companions/authenticator/back_off.h"
#include "tee/companions/authenticator/password_handle.h"
#include "tee/companions/common/auth_token_mint.h"
#include "tee/companions/common/command_table.h"
#include "tee/companions/common/fixed_object.h"

namespace keymaster::authenticator {
namespace {

/// What a client shows to prove who they are, as a view of the request.
struct presented {
  std::span<const uint8_t> handle;
  std::span<const uint8_t> password;

  [[nodiscard]] bool is_nothing() const { return handle.empty() && password.empty(); }
  /// What is of another size was never enrolled, and need not be copied to be refused.
  [[nodiscard]] bool may_be_right() const { return handle.size() == handle_size && password.size() <= password_limit; }
};

/// The TA's own copy: the request may change meanwhile.
struct credential {
  heap_bytes handle;
  secret_bytes password;

  [[nodiscard]] TEE_Result take(const presented& shown) {
    if (!shown.may_be_right()) return TEE_SUCCESS;
    return handle.copy_of(shown.handle) && password.copy_of(shown.password) ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
  }
};

bool read_presented(byte_reader& in, presented& shown) {
  return in.read_block(shown.handle) && in.read_block(shown.password);
}

TEE_Result refuse_request() {
  TRACE_ERROR("Malformed request\n");
  return TEE_ERROR_BAD_PARAMETERS;
}

/// prove finds out whether `shown` is the user's. TEE_ERROR_ACCESS_DENIED: no; TEE_ERROR_BUSY: it is too early to ask.
TEE_Result prove(companion::keyed_mac& mac, uint32_t uid, const presented& shown, uint64_t* secure_id,
                 uint32_t* wait_ms) {
  credential own;
  if (TEE_Result r = own.take(shown); r != TEE_SUCCESS) return r;
  attempt this_one;
  if (TEE_Result r = this_one.begin(uid, wait_ms); r != TEE_SUCCESS) return r;
  bool right = false;
  if (TEE_Result r = check_handle(mac, uid, own.password.span(), own.handle.span(), &right, secure_id);
      r != TEE_SUCCESS) {
    this_one.gave_no_answer();
    return r;
  }
  if (right) return this_one.proved_right();
  TRACE_ERROR("Wrong password or handle\n");
  return TEE_ERROR_ACCESS_DENIED;
}

/// The secure id of a user who has none to keep.
uint64_t draw_secure_id() {
  uint8_t bytes[sizeof(uint64_t)];
  companion::draw(bytes);
  return load_u64(bytes);
}

struct enrolment {
  presented present;
  std::span<const uint8_t> password;  // the new one
};

bool read_enrolment(std::span<const uint8_t> request, enrolment& wanted) {
  byte_reader in{request};
  return read_presented(in, wanted.present) && in.read_block(wanted.password) && in.remaining() == 0 &&
         !wanted.password.empty() && wanted.password.size() <= password_limit;
}

/// A fresh enrolment does not end a row of failures: else it would be the way to try the present password for ever.
TEE_Result enrol_user(uint32_t uid, std::span<const uint8_t> request, std::span<uint8_t, handle_size> handle,
                      uint64_t* secure_id, uint32_t* wait_ms) {
  enrolment wanted;
  if (!read_enrolment(request, wanted)) return refuse_request();
  secret_bytes password;
  if (!password.copy_of(wanted.password)) return TEE_ERROR_OUT_OF_MEMORY;
  companion::keyed_mac mac;
  if (TEE_Result r = prepare_handle_mac(mac); r != TEE_SUCCESS) return r;
  if (wanted.present.is_nothing()) {
    *secure_id = draw_secure_id();
  } else if (TEE_Result r = prove(mac, uid, wanted.present, secure_id, wait_ms); r != TEE_SUCCESS) {
    return r;
  }
  return make_handle(mac, uid, *secure_id, password.span(), handle);
}

TEE_Result enrol(TEE_Param params[4]) {
  if (TEE_Result r = companion::check_room(params[2], handle_size); r != TEE_SUCCESS) return r;
  uint8_t handle[handle_size];
  uint64_t secure_id = 0;
  uint32_t wait_ms = 0;
  const TEE_Result result =
      enrol_user(params[0].value.a, companion::memref_bytes(params[1]), handle, &secure_id, &wait_ms);
  params[3].value.a = result == TEE_SUCCESS ? static_cast<uint32_t>(secure_id) : wait_ms;
  params[3].value.b = result == TEE_SUCCESS ? static_cast<uint32_t>(secure_id >> 32) : 0;
  return companion::answer_outcome(params[2], result, handle);
}

/// Everything that can be lacking and doesn't depend on the password is had before it is looked at.
TEE_Result verify_user(uint32_t uid, std::span<const uint8_t> request,
                       std::span<uint8_t, companion::auth_token_size> token, uint32_t* wait_ms) {
  companion::auth_token_claim claim = {.authenticator_type = companion::AUTHENTICATOR_PASSWORD};
  presented shown;
  byte_reader in{request};
  if (!in.copy_to(&claim.challenge, sizeof claim.challenge) || !read_presented(in, shown) || in.remaining() != 0) {
    return refuse_request();
  }
  companion::keyed_mac mac;
  if (TEE_Result r = prepare_handle_mac(mac); r != TEE_SUCCESS) return r;
  if (TEE_Result r = companion::draw_id_once("pwauth.authid", &claim.authenticator_id); r != TEE_SUCCESS) return r;
  if (TEE_Result r = prove(mac, uid, shown, &claim.secure_id, wait_ms); r != TEE_SUCCESS) return r;
  claim.time_ms = companion::system_time_ms();
  return companion::mint_auth_token(claim, token);
}

TEE_Result verify(TEE_Param params[4]) {
  const uint32_t uid = params[0].value.a;
  params[0].value.a = 0;
  if (TEE_Result r = companion::check_room(params[2], companion::auth_token_size); r != TEE_SUCCESS) return r;
  uint8_t token[companion::auth_token_size];
  const TEE_Result result = verify_user(uid, companion::memref_bytes(params[1]), token, &params[0].value.a);
  return companion::answer_outcome(params[2], result, token);
}

constexpr companion::command_row rows[] = {
    {COMMAND_ENROL, "enrol password",
     TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INPUT, TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT,
                     TEE_PARAM_TYPE_VALUE_OUTPUT),
     companion::caller_rule::normal_world, enrol},
    {COMMAND_VERIFY, "verify password",
     TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INOUT, TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0),
     companion::caller_rule::normal_world, verify},
};

}  // namespace
}  // namespace keymaster::authenticator

constinit const std::span<const keymaster::companion::command_row> keymaster::companion::commands{
    keymaster::authenticator::rows};
