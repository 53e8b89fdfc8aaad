// Scenarios of finish.
#include <gtest/gtest.h>

#include "tests/faults/stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

struct signature_scheme {
  std::uint32_t digest, padding;
};
constexpr signature_scheme pkcs1 = {KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN};
constexpr signature_scheme pss = {KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS};
constexpr signature_scheme pss_with_the_longest_salt = {KM_DIGEST_SHA_2_512, KM_PAD_RSA_PSS};
constexpr signature_scheme raw_pkcs1 = {KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN};
constexpr signature_scheme unpadded = {KM_DIGEST_NONE, KM_PAD_NONE};

act key_for(const signature_scheme& scheme, const param_list& params = rsa_key(1024)) {
  return [=](stage& on) {
    on.import(params);
    on.params = signature(scheme.digest, scheme.padding);
  };
}

/// The same, and a signature to verify.
act key_and_signature(const signature_scheme& scheme) {
  return [=](stage& on) {
    key_for(scheme)(on);
    on.signature = on.client().sign(on.blob, on.params, on.message).data;
  };
}

act fed(std::uint32_t purpose) {
  return [=](stage& on) {
    on.begin(purpose);
    EXPECT_TRUE(on.client().update(on.handle, on.message).ok());
  };
}

void fed_with_a_token(stage& on) {
  on.begin(KM_PURPOSE_SIGN);
  EXPECT_TRUE(on.client().update(on.handle, on.message, on.with_token()).ok());
}

answer finish(stage& on) {
  return on.client().finish(on.handle);
}
answer finish_with_signature(stage& on) {
  return on.client().finish(on.handle, on.signature);
}
answer finish_with_wrong_signature(stage& on) {
  return on.client().finish(on.handle, flip(on.signature, 100));
}

bytes signature_in(const answer& done) {
  return {done.output.begin() + 4, done.output.begin() + 4 + u32_at(done.output, 0)};
}

/// The answer is a signature of the message.
std::function<void(stage&, const answer&)> signs_by(const signature_scheme& scheme) {
  return [=](stage& on, const answer& done) {
    EXPECT_TRUE(on.key.verifies(scheme.digest, scheme.padding, on.message, signature_in(done)));
  };
}
void signs_a_block(stage& on, const answer& done) {
  const bytes block = on.key.public_operation(signature_in(done));
  EXPECT_EQ(bytes(block.end() - static_cast<std::ptrdiff_t>(on.message.size()), block.end()), on.message);
}

}  // namespace

std::vector<scenario> finish_scenarios() {
  const act signing = fed(KM_PURPOSE_SIGN), verifying = fed(KM_PURPOSE_VERIFY);
  return {
      {"finish_sign_pkcs1", key_for(pkcs1), signing, finish, signs_by(pkcs1)},
      {"finish_sign_pss", key_for(pss), signing, finish, signs_by(pss)},
      {"finish_sign_pss_with_the_longest_salt", key_for(pss_with_the_longest_salt), signing, finish,
       signs_by(pss_with_the_longest_salt)},
      {"finish_sign_raw_pkcs1", key_for(raw_pkcs1), signing, finish, signs_a_block},
      {"finish_sign_raw", key_for(unpadded), signing, finish, signs_a_block},
      {"finish_verify_pkcs1", key_and_signature(pkcs1), verifying, finish_with_signature},
      {"finish_verify_pss", key_and_signature(pss), verifying, finish_with_signature},
      {"finish_verify_raw_pkcs1", key_and_signature(raw_pkcs1), verifying, finish_with_signature},
      {"finish_verify_wrong_pkcs1",
       key_and_signature(pkcs1),
       verifying,
       finish_with_wrong_signature,
       {},
       TEEC_SUCCESS,
       KM_ERROR_VERIFICATION_FAILED},
      {"finish_verify_wrong_raw",
       key_and_signature(raw_pkcs1),
       verifying,
       finish_with_wrong_signature,
       {},
       TEEC_SUCCESS,
       KM_ERROR_VERIFICATION_FAILED},
      {"finish_sign_too_large_a_number",
       [](stage& on) {
         key_for(unpadded)(on);
         on.message = bytes(128, 0xFF);
       },
       signing,
       finish,
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_ARGUMENT},
      {"finish_without_room",
       key_for(pkcs1),
       signing,
       [](stage& on) { return on.client().finish(on.handle, {}, {}, 64); },
       {},
       TEEC_ERROR_GENERIC,
       KM_ERROR_UNKNOWN_ERROR},
      {"finish_with_half_a_body",
       key_for(pkcs1),
       signing,
       [](stage& on) { return on.client().call(KM_COMMAND_FINISH, on.handle, 0, bytes(3), std::size_t{64}); },
       {},
       TEEC_ERROR_GENERIC,
       KM_ERROR_UNKNOWN_ERROR},
      {"finish_with_a_token", key_for(pkcs1, bound_key()), fed_with_a_token,
       [](stage& on) { return on.client().finish(on.handle, {}, on.with_token()); }, signs_by(pkcs1)},
      {"finish_without_the_token",
       key_for(pkcs1, bound_key()),
       fed_with_a_token,
       finish,
       {},
       TEEC_SUCCESS,
       KM_ERROR_KEY_USER_NOT_AUTHENTICATED},
      {"finish_of_nothing",
       key_for(pkcs1),
       {},
       [](stage& on) { return on.client().finish(1); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_OPERATION_HANDLE},
  };
}

}  // namespace testing_support
