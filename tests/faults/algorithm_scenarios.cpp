// Scenarios of the algorithms beside RSA signatures: keys, and each step of each kind of operation.
#include <gtest/gtest.h>

#include "tests/faults/algorithm_kinds.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

void end_it(stage& on, const answer& begun) {
  EXPECT_TRUE(on.client().abort(begun.b).ok());
}

scenario begin_of(const kind& what) {
  scenario play{"begin_" + what.name,
                [what](stage& on) { arrange(on, what); },
                {},
                [what](stage& on) { return on.client().begin(what.purpose, on.blob, on.params); },
                end_it};
  play.begins = true;
  return play;
}

scenario update_of(const kind& what) {
  scenario play{"update_" + what.name, [what](stage& on) { arrange(on, what); },
                [what](stage& on) { on.begin(what.purpose); },
                [what](stage& on) { return on.client().update(on.handle, on.message, what.update_params()); },
                [](stage& on, const answer& updated) {
                  EXPECT_EQ(updated.b, on.message.size());
                  EXPECT_TRUE(on.client().abort(on.handle).ok());
                }};
  return play;
}

scenario finish_of(const kind& what) {
  scenario play{"finish_" + what.name, [what](stage& on) { arrange(on, what); },
                [what](stage& on) {
                  on.begin(what.purpose);
                  EXPECT_TRUE(on.client().update(on.handle, on.message, what.update_params()).ok());
                },
                [](stage& on) { return on.client().finish(on.handle, on.signature); }};
  play.may_outlive_platform = what.finishes_despite_platform;
  return play;
}

/// A begin that the operation itself refuses, the key allowing it.
scenario refused_begin(const std::string& name, const kind& what, const param_list& params, std::int32_t error) {
  scenario play{name,
                [what](stage& on) { arrange(on, what); },
                {},
                [what, params](stage& on) { return on.client().begin(what.purpose, on.blob, params); }};
  play.error = error;
  return play;
}

/// A finish that fails by what it was fed, `change`d from what would have passed.
scenario failing_finish(const std::string& name, const kind& what, std::int32_t error, const act& change) {
  scenario play = finish_of(what);
  play.name = "finish_" + name;
  play.arrange = [what, change](stage& on) {
    arrange(on, what);
    change(on);
  };
  play.error = error;
  return play;
}

scenario generate_of(const std::string& name, const param_list& key) {
  scenario play{"generate_" + name,
                [](stage&) {},
                {},
                [key](stage& on) { return on.client().generate(key, 2048); },
                [](stage& on, const answer& made) { EXPECT_TRUE(on.client().characteristics_size(made.body()).ok()); }};
  play.zeroes_response = true;
  return play;
}

scenario import_of(const std::string& name, const param_list& key, const bytes& material) {
  scenario play{"import_" + name,
                [](stage&) {},
                {},
                [key, material](stage& on) { return on.client().import_key(key, material, 2048); }};
  play.zeroes_response = true;
  return play;
}

std::vector<scenario> refused_begins() {
  kind lists_md5 = ec_kind("ec_sign", KM_PURPOSE_SIGN, KM_DIGEST_SHA_2_256);
  lists_md5.key.add(KM_TAG_DIGEST, KM_DIGEST_MD5);
  return {
      refused_begin("begin_cbc_with_a_nonce_too_long", cbc_decrypt(), aes_kind_operation(KM_MODE_CBC, KM_PAD_PKCS7, 17),
                    KM_ERROR_INVALID_ARGUMENT),
      refused_begin("begin_gcm_with_a_nonce_too_short", gcm_decrypt(), aes_kind_operation(KM_MODE_GCM, KM_PAD_NONE, 11),
                    KM_ERROR_INVALID_ARGUMENT),
      refused_begin(
          "begin_gcm_with_a_tag_of_100_bits", gcm_decrypt(),
          aes_kind_operation(KM_MODE_GCM, KM_PAD_NONE, 12).remove(KM_TAG_MAC_LENGTH).add(KM_TAG_MAC_LENGTH, 100),
          KM_ERROR_UNSUPPORTED_MAC_LENGTH),
      refused_begin("begin_ec_with_md5", lists_md5, param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_MD5),
                    KM_ERROR_INCOMPATIBLE_DIGEST),
      refused_begin("begin_hmac_without_a_length", hmac_kind("hmac_sign", KM_PURPOSE_SIGN),
                    hmac_kind_operation().remove(KM_TAG_MAC_LENGTH), KM_ERROR_INVALID_ARGUMENT),
      refused_begin("begin_hmac_with_too_short_a_length", hmac_kind("hmac_sign", KM_PURPOSE_SIGN),
                    hmac_kind_operation().remove(KM_TAG_MAC_LENGTH).add(KM_TAG_MAC_LENGTH, 56),
                    KM_ERROR_INVALID_MAC_LENGTH),
  };
}

std::vector<scenario> failing_finishes() {
  const act wrong_signature = [](stage& on) { on.signature = flip(on.signature, on.signature.size() - 1); };
  const act wrong_end = [](stage& on) { on.message = flip(on.message, on.message.size() - 1); };
  // With CBC a changed bit shows in the next block at the same place: here in the count of the padding.
  const act wrong_padding = [](stage& on) { on.message = flip(on.message, on.message.size() - 17); };
  return {
      failing_finish("ec_verify_wrong", ec_kind("", KM_PURPOSE_VERIFY, KM_DIGEST_SHA_2_256),
                     KM_ERROR_VERIFICATION_FAILED, wrong_signature),
      failing_finish("ec_verify_no_der", ec_kind("", KM_PURPOSE_VERIFY, KM_DIGEST_NONE), KM_ERROR_VERIFICATION_FAILED,
                     [](stage& on) { on.signature.pop_back(); }),
      failing_finish("hmac_verify_wrong", hmac_kind("", KM_PURPOSE_VERIFY), KM_ERROR_VERIFICATION_FAILED,
                     wrong_signature),
      failing_finish("gcm_decrypt_wrong_tag", gcm_decrypt(), KM_ERROR_VERIFICATION_FAILED, wrong_end),
      failing_finish("cbc_decrypt_wrong_padding", cbc_decrypt(), KM_ERROR_INVALID_ARGUMENT, wrong_padding),
      failing_finish("cbc_decrypt_broken_block", cbc_decrypt(), KM_ERROR_INVALID_INPUT_LENGTH,
                     [](stage& on) { on.message.pop_back(); }),
      failing_finish("cbc_encrypt_broken_block", aes_kind("", KM_PURPOSE_ENCRYPT, KM_MODE_CBC, KM_PAD_NONE, 16),
                     KM_ERROR_INVALID_INPUT_LENGTH, [](stage& on) { on.message.pop_back(); }),
      failing_finish("rsa_oaep_encrypt_too_long",
                     rsa_kind("", KM_PURPOSE_ENCRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP),
                     KM_ERROR_INVALID_INPUT_LENGTH, [](stage& on) { on.message = pattern(63); }),
      failing_finish("rsa_oaep_decrypt_wrong_padding",
                     rsa_kind("", KM_PURPOSE_DECRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP), KM_ERROR_INVALID_ARGUMENT,
                     wrong_end),
      failing_finish("rsa_raw_encrypt_too_large_a_number",
                     rsa_kind("", KM_PURPOSE_ENCRYPT, KM_DIGEST_NONE, KM_PAD_NONE), KM_ERROR_INVALID_ARGUMENT,
                     [](stage& on) { on.message = bytes(128, 0xFF); }),
  };
}

/// Updates that are not the only one of their operation.
std::vector<scenario> further_updates() {
  scenario held = update_of(cbc_decrypt());
  held.name = "update_aes_cbc_decrypt_with_a_block_held_back";
  held.approach = [](stage& on) {
    on.begin(KM_PURPOSE_DECRYPT);
    const bytes block(on.message.begin(), on.message.begin() + 16);
    EXPECT_TRUE(on.client().update(on.handle, block).ok());
  };
  const kind sealing = with_aad(gcm_encrypt());
  scenario aad_alone = update_of(sealing);
  aad_alone.name = "update_aes_gcm_encrypt_with_aad_alone";
  aad_alone.run = [sealing](stage& on) { return on.client().update(on.handle, {}, sealing.update_params()); };
  aad_alone.settle = [](stage& on, const answer& updated) {
    EXPECT_EQ(updated.b, 0U);
    EXPECT_TRUE(on.client().abort(on.handle).ok());
  };
  return {held, aad_alone};
}

}  // namespace

std::vector<scenario> algorithm_scenarios() {
  std::vector<scenario> all = {
      generate_of("aes", aes_kind_key(KM_MODE_GCM, KM_PAD_NONE)),
      generate_of("ec", ec_kind_key()),
      generate_of("hmac", hmac_kind_key()),
      import_of("aes", aes_kind_key(KM_MODE_CBC, KM_PAD_PKCS7), pattern(16)),
      import_of("ec", ec_kind_key(), ec_test_key::of_bits(256).material()),
      import_of("hmac", hmac_kind_key(), pattern(32)),
      import_of("hmac_with_size_unsaid", hmac_kind_key().remove(KM_TAG_KEY_SIZE), pattern(32)),
  };
  for (const auto& some : {refused_begins(), failing_finishes(), further_updates()}) {
    all.insert(all.end(), some.begin(), some.end());
  }
  for (const kind& each : every_kind()) {
    all.push_back(begin_of(each));
    all.push_back(update_of(each));
    all.push_back(finish_of(each));
  }
  all.push_back({"export_ec",
                 [](stage& on) { on.blob = on.client().must_generate(ec_kind_key()); },
                 {},
                 [](stage& on) { return on.client().export_key(on.blob); }});
  return all;
}

}  // namespace testing_support
