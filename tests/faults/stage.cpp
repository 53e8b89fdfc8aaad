#include "tests/faults/stage.h"

#include "tests/support/issued_token.h"

using namespace keymaster;

namespace testing_support {
namespace {
constexpr std::uint64_t user = 77;
}

void stage::provision() {
  quil.provision(rsa_test_key::of_bits(2048).components());
  tee.world().device().other_tas = &quil;
}

// The message has no slot for a status: its result tells all.
answer stage::notify(const bytes& fid_message) {
  hosted_tee::secure_world& world = tee.world();
  bytes body = fid_message;
  std::uint32_t session = 0;
  answer told;
  TEE_Param none[4] = {}, slots[4] = {};
  slots[1].memref = {body.data(), static_cast<std::uint32_t>(body.size())};
  told.result =
      world.open_session(keymaster_ta, {TEE_LOGIN_TRUSTED_APP, fingerprint_ta}, 0, none, session, told.origin);
  if (told.result != TEE_SUCCESS) return told;
  told.result = world.invoke(session, KM_COMMAND_SOTER_SET_FID, TEE_PARAM_TYPES(0, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0),
                             slots, told.origin);
  world.close_session(session);
  told.error = told.result == TEE_SUCCESS ? KM_ERROR_OK : KM_ERROR_UNKNOWN_ERROR;
  return told;
}

void stage::import(const param_list& list) {
  blob = client().must_import(list, key.material());
}

void stage::begin(std::uint32_t purpose) {
  handle = client().must_begin(purpose, blob, params);
}

bytes stage::token(std::uint64_t challenge) {
  return issued_token{.challenge = challenge, .user_id = user}.issue(tee.world().boot_seed());
}

param_list bound_key() {
  return rsa_key(1024).remove(KM_TAG_NO_AUTH_REQUIRED).add(KM_TAG_USER_SECURE_ID, user).add(KM_TAG_USER_AUTH_TYPE, 1);
}

}  // namespace testing_support
