#include "tests/faults/stage.h"

#include "tests/support/issued_token.h"

using namespace keymaster;

namespace testing_support {
namespace {
constexpr std::uint64_t user = 77;
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
