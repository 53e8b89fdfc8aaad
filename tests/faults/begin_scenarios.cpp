// Scenarios of begin.
#include <gtest/gtest.h>

#include "tests/faults/stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t many_uses = 1'000'000;
constexpr std::uint32_t seconds_between_uses = 60;

answer begin_signing(stage& on) {
  return on.client().begin(KM_PURPOSE_SIGN, on.blob, on.params);
}
answer begin_verifying(stage& on) {
  return on.client().begin(KM_PURPOSE_VERIFY, on.blob, on.params);
}
void end_it(stage& on, const answer& begun) {
  EXPECT_NE(begun.b, 0U);
  EXPECT_TRUE(on.client().abort(begun.b).ok());
}

/// A key of the usual kind with more to it, and a scheme to use it with.
act key_with(param_list params, std::uint32_t digest = KM_DIGEST_SHA_2_256,
             std::uint32_t padding = KM_PAD_RSA_PKCS1_1_5_SIGN) {
  return [params = std::move(params), digest, padding](stage& on) {
    on.import(params);
    on.params = signature(digest, padding);
  };
}
act scheme(std::uint32_t digest, std::uint32_t padding) {
  return key_with(rsa_key(1024), digest, padding);
}

/// The wall clock as close to the system clock as a rate limit needs it to refuse, and one use recorded.
void used_a_moment_ago(stage& on) {
  on.tee.close_session();
  on.tee.world().clock().set_ree(start_system);
  on.tee.open_session();
  key_with(rsa_key(1024).add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, seconds_between_uses))(on);
  on.begin(KM_PURPOSE_SIGN);
  EXPECT_TRUE(on.client().abort(on.handle).ok());
}

void used_up(stage& on) {
  key_with(rsa_key(1024).add(KM_TAG_MAX_USES_PER_BOOT, 1))(on);
  on.begin(KM_PURPOSE_SIGN);
  EXPECT_TRUE(on.client().abort(on.handle).ok());
}

/// With the operation that every scenario has beside its own, all 16 are there.
void pool_is_full(stage& on) {
  scheme(KM_DIGEST_NONE, KM_PAD_NONE)(on);
  for (int i = 0; i < 15; ++i) on.fillers.push_back(begin_verifying(on).b);
}

std::vector<scenario> scheme_scenarios() {
  const act pkcs1 = scheme(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN),
            pss = scheme(KM_DIGEST_SHA_2_512, KM_PAD_RSA_PSS), raw = scheme(KM_DIGEST_NONE, KM_PAD_NONE),
            raw_pkcs1 = scheme(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN);
  return {
      {"begin_sign_pkcs1", pkcs1, {}, begin_signing, end_it},
      {"begin_verify_pkcs1", pkcs1, {}, begin_verifying, end_it},
      {"begin_sign_pss", pss, {}, begin_signing, end_it},
      {"begin_verify_pss", pss, {}, begin_verifying, end_it},
      {"begin_sign_raw", raw, {}, begin_signing, end_it},
      {"begin_verify_raw", raw, {}, begin_verifying, end_it},
      {"begin_sign_raw_pkcs1", raw_pkcs1, {}, begin_signing, end_it},
      {"begin_with_a_scheme_that_is_none",
       scheme(KM_DIGEST_SHA_2_256, KM_PAD_NONE),
       {},
       begin_signing,
       {},
       TEEC_SUCCESS,
       KM_ERROR_INCOMPATIBLE_DIGEST},
      {"begin_without_a_scheme",
       [](stage& on) { on.import(); },
       {},
       begin_signing,
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_ARGUMENT},
      {"begin_without_room",
       raw,
       {},
       [](stage& on) { return on.client().begin(KM_PURPOSE_SIGN, on.blob, on.params, 3); },
       {},
       TEEC_ERROR_SHORT_BUFFER,
       KM_ERROR_UNKNOWN_ERROR},
      {"begin_while_the_pool_is_full", pool_is_full, {}, begin_signing, {}, TEEC_SUCCESS, KM_ERROR_TOO_MANY_OPERATIONS},
  };
}

std::vector<scenario> policy_scenarios() {
  return {
      {"begin_with_counted_uses",
       key_with(rsa_key(1024).add(KM_TAG_MAX_USES_PER_BOOT, many_uses)),
       {},
       begin_signing,
       end_it},
      {"begin_with_the_uses_used_up", used_up, {}, begin_signing, {}, TEEC_SUCCESS, KM_ERROR_KEY_MAX_OPS_EXCEEDED},
      {"begin_with_a_rate_limit",
       key_with(rsa_key(1024).add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, seconds_between_uses)),
       {},
       begin_signing,
       end_it},
      {"begin_above_the_rate_limit",
       used_a_moment_ago,
       {},
       begin_signing,
       {},
       TEEC_SUCCESS,
       KM_ERROR_KEY_RATE_LIMIT_EXCEEDED},
      {"begin_with_an_expired_key",
       key_with(rsa_key(1024).add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, 1)),
       {},
       begin_signing,
       {},
       TEEC_SUCCESS,
       KM_ERROR_KEY_EXPIRED},
      {"begin_for_a_token_later", key_with(bound_key()), {}, begin_signing, end_it},
      {"begin_with_a_token",
       key_with(bound_key().add(KM_TAG_AUTH_TIMEOUT, 600)),
       {},
       [](stage& on) {
         param_list params = on.params;
         return on.client().begin(KM_PURPOSE_SIGN, on.blob, params.add_blob(KM_TAG_AUTH_TOKEN, on.token(0)));
       },
       end_it},
      {"begin_with_a_forged_token",
       key_with(bound_key().add(KM_TAG_AUTH_TIMEOUT, 600)),
       {},
       [](stage& on) {
         param_list params = on.params;
         return on.client().begin(KM_PURPOSE_SIGN, on.blob, params.add_blob(KM_TAG_AUTH_TOKEN, bytes(69)));
       },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_ARGUMENT},
      {"begin_without_the_token",
       key_with(bound_key().add(KM_TAG_AUTH_TIMEOUT, 600)),
       {},
       begin_signing,
       {},
       TEEC_SUCCESS,
       KM_ERROR_KEY_USER_NOT_AUTHENTICATED},
      {"begin_for_an_application",
       [](stage& on) {
         on.import(rsa_key(1024).add_blob(KM_TAG_APPLICATION_ID, from_text("id")));
         on.params = signature(KM_DIGEST_NONE, KM_PAD_NONE).add_blob(KM_TAG_APPLICATION_ID, from_text("id"));
       },
       {},
       begin_signing,
       end_it},
      {"begin_with_a_soter_key",
       key_with(rsa_key(1024).add(KM_TAG_SOTER_KEY)),
       {},
       begin_signing,
       {},
       TEEC_SUCCESS,
       KM_ERROR_UNKNOWN_ERROR},
      {"begin_without_rpmb", key_with(rsa_key(1024)), {}, begin_signing, end_it, TEEC_SUCCESS, 0, false, false},
  };
}

}  // namespace

std::vector<scenario> begin_scenarios() {
  std::vector<scenario> all = scheme_scenarios();
  for (scenario& each : policy_scenarios()) all.push_back(std::move(each));
  return all;
}

}  // namespace testing_support
