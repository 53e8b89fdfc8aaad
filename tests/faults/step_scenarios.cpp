// Scenarios of update and abort.
#include <gtest/gtest.h>

#include "tests/faults/stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

act key_for(std::uint32_t digest, std::uint32_t padding, const param_list& params = rsa_key(1024)) {
  return [=](stage& on) {
    on.import(params);
    on.params = signature(digest, padding);
  };
}
void begin_signing(stage& on) {
  on.begin(KM_PURPOSE_SIGN);
}
void begin_verifying(stage& on) {
  on.begin(KM_PURPOSE_VERIFY);
}
answer update(stage& on) {
  return on.client().update(on.handle, on.message);
}
void consumed_all(stage& on, const answer& updated) {
  EXPECT_EQ(updated.b, on.message.size());
  EXPECT_TRUE(on.client().abort(on.handle).ok());
}

}  // namespace

std::vector<scenario> step_scenarios() {
  const act digest = key_for(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN),
            raw = key_for(KM_DIGEST_NONE, KM_PAD_NONE),
            bound = key_for(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS, bound_key());
  return {
      {"update_sign_digest", digest, begin_signing, update, consumed_all},
      {"update_verify_digest", digest, begin_verifying, update, consumed_all},
      {"update_sign_raw", raw, begin_signing, update, consumed_all},
      {"update_verify_raw", raw, begin_verifying, update, consumed_all},
      {"update_with_parameters", digest, begin_signing,
       [](stage& on) {
         return on.client().update(on.handle, on.message,
                                   param_list{}.add_blob(KM_TAG_ASSOCIATED_DATA, {1}).add_blob(KM_TAG_NONCE, {2, 3}));
       },
       consumed_all},
      {"update_with_a_token", bound, begin_signing,
       [](stage& on) { return on.client().update(on.handle, on.message, on.with_token()); }, consumed_all},
      {"update_without_the_token", bound, begin_signing, update, {}, TEEC_SUCCESS, KM_ERROR_KEY_USER_NOT_AUTHENTICATED},
      {"update_with_a_token_for_another_operation",
       bound,
       begin_signing,
       [](stage& on) {
         return on.client().update(on.handle, on.message,
                                   param_list{}.add_blob(KM_TAG_AUTH_TOKEN, on.token(on.handle + 1)));
       },
       {},
       TEEC_SUCCESS,
       KM_ERROR_KEY_USER_NOT_AUTHENTICATED},
      {"update_with_too_much",
       raw,
       begin_signing,
       [](stage& on) { return on.client().update(on.handle, bytes(129)); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_INPUT_LENGTH},
      {"update_with_half_a_body",
       raw,
       begin_signing,
       [](stage& on) { return on.client().call(KM_COMMAND_UPDATE, on.handle, 0, bytes(3), std::size_t{64}); },
       {},
       TEEC_ERROR_GENERIC,
       KM_ERROR_UNKNOWN_ERROR},
      {"update_of_nothing",
       raw,
       {},
       [](stage& on) { return on.client().update(1, on.message); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_OPERATION_HANDLE},
      {"abort", digest, begin_signing, [](stage& on) { return on.client().abort(on.handle); }},
      {"abort_of_nothing",
       raw,
       {},
       [](stage& on) { return on.client().abort(1); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_OPERATION_HANDLE},
  };
}

}  // namespace testing_support
