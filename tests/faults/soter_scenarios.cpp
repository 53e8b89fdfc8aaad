// Scenarios of the soter framework, once its resources are loaded.
#include <gtest/gtest.h>

#include "tests/faults/soter_stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// The longest message that the buffer of a new operation takes.
constexpr std::size_t first_capacity = 4096;

void loaded(stage& on) {
  on.provision();
  ASSERT_TRUE(soter_generate(on).ok());
}

/// The framework is ready, and so is a key of it.
act key_of(const param_list& params) {
  return [=](stage& on) {
    loaded(on);
    on.import(params);
    on.params = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  };
}

/// A key that another one signs for; `tag` names that one's blob.
act key_signed_by_key(std::uint32_t tag) {
  return [=](stage& on) {
    on.import();
    key_of(rsa_key(1024).add(KM_TAG_SOTER_KEY).add(KM_TAG_SOTER_SIGNED_BY_KEY).add_blob(tag, on.blob))(on);
  };
}

answer export_statement(stage& on) {
  return on.client().export_key(on.blob);
}

/// The export is the statement of `on.key`, and its signature that of a key of `bits`.
std::function<void(stage&, const answer&)> is_signed_by(unsigned bits) {
  return [=](stage& on, const answer& got) {
    const soter_statement made = statement_in(got.body());
    EXPECT_TRUE(made.signed_by(rsa_test_key::of_bits(bits)));
    EXPECT_EQ(on.quil.open_sessions, 0);
  };
}

void without_a_counter(stage& on) {
  on.tee.world().delete_object(keymaster_ta, TEE_STORAGE_PRIVATE, {"SOTER_COUNTER_OBJECT", 21});
}
void counts_from_one(stage& on, const answer& got) {
  is_signed_by(2048)(on, got);
  EXPECT_EQ(statement_in(got.body()).counter(), 1U);
}

void begin_signing(stage& on) {
  on.begin(KM_PURPOSE_SIGN);
}
act fed(std::size_t size) {
  return [=](stage& on) {
    on.message = bytes(size, 'm');
    begin_signing(on);
    EXPECT_TRUE(on.client().update(on.handle, on.message).ok());
  };
}
answer update(stage& on) {
  return on.client().update(on.handle, on.message);
}
void took_all(stage& on, const answer& updated) {
  EXPECT_EQ(updated.b, on.message.size());
  EXPECT_TRUE(on.client().abort(on.handle).ok());
}
answer finish(stage& on) {
  return on.client().finish(on.handle, {}, {}, 16384);
}
void states_the_message(stage& on, const answer& done) {
  const bytes output(done.output.begin() + 4, done.output.begin() + 4 + u32_at(done.output, 0));
  const soter_statement made = statement_in(output);
  EXPECT_TRUE(made.text.starts_with("{\"raw\":\"" + std::string(on.message.begin(), on.message.end()) + "\","));
  EXPECT_EQ(made.text.back(), 0);
  EXPECT_TRUE(made.signed_by(on.key));
}

std::vector<scenario> service_scenarios() {
  return {
      {"soter_generate", loaded, {}, soter_generate},
      // It loads the key anew each time, and tries again where memory was wanted.
      {.name = "soter_verify",
       .arrange = loaded,
       .approach = {},
       .run = soter_verify,
       .may_outlive_platform = true,
       .may_outlive_memory = true},
      {"soter_export_attk",
       loaded,
       {},
       soter_export_attk,
       [](stage&, const answer& got) { EXPECT_EQ(got.size, 445U); }},
      {.name = "soter_device_id",
       .arrange = loaded,
       .approach = {},
       .run = soter_device_id,
       .settle = [](stage&, const answer& got) { EXPECT_EQ(got.body(), pattern(32)); },
       .keeps_size = true},
      {"soter_set_fid",
       loaded,
       {},
       [](stage& on) {
         return on.notify(join({u32(0), u32(9), u64(7'200'250)}));
       }},
      {"soter_set_fid_of_another_version",
       loaded,
       {},
       [](stage& on) {
         return on.notify(join({u32(1), u32(9), u64(7'200'250)}));
       },
       {},
       TEEC_ERROR_BAD_FORMAT,
       KM_ERROR_UNKNOWN_ERROR},
  };
}

std::vector<scenario> export_scenarios() {
  return {
      {"soter_export_under_the_attestation_key", key_of(soter_attk_key()), {}, export_statement, is_signed_by(2048)},
      {"soter_export_that_creates_the_counter", key_of(soter_attk_key()), without_a_counter, export_statement,
       counts_from_one},
      {"soter_export_under_a_key",
       key_signed_by_key(KM_TAG_SOTER_SIGNING_KEY_BLOB),
       {},
       export_statement,
       is_signed_by(1024)},
      {"soter_export_under_a_named_key",
       key_signed_by_key(KM_TAG_SOTER_SIGNING_KEY_NAME),
       {},
       export_statement,
       is_signed_by(1024)},
      {"soter_export_without_room",
       key_of(soter_attk_key()),
       {},
       [](stage& on) { return on.client().export_key(on.blob, {}, {}, 560); },
       {},
       TEEC_ERROR_SHORT_BUFFER,
       KM_ERROR_UNKNOWN_ERROR},
      {"soter_export_without_a_signer",
       key_of(rsa_key(1024).add(KM_TAG_SOTER_KEY).add(KM_TAG_SOTER_SIGNED_BY_KEY)),
       {},
       export_statement,
       {},
       TEEC_ERROR_ITEM_NOT_FOUND,
       KM_ERROR_UNKNOWN_ERROR},
  };
}

std::vector<scenario> sign_scenarios() {
  const act key = key_of(soter_attk_key());
  const act pss = [](stage& on) {
    key_of(soter_attk_key())(on);
    on.params = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS);
  };
  return {
      {"soter_begin",
       key,
       {},
       [](stage& on) { return on.client().begin(KM_PURPOSE_SIGN, on.blob, on.params); },
       [](stage& on, const answer& begun) { EXPECT_TRUE(on.client().abort(begun.b).ok()); }},
      {"soter_update", key, begin_signing, update, took_all},
      {"soter_update_that_grows_the_buffer", key, fed(first_capacity), update, took_all},
      {"soter_update_with_more_than_the_buffer", key,
       [](stage& on) {
         on.message = bytes(3 * first_capacity, 'm');
         begin_signing(on);
       },
       update, took_all},
      {"soter_finish", key, fed(20), finish, states_the_message},
      {"soter_finish_of_a_full_buffer", key, fed(first_capacity), finish, states_the_message},
      {"soter_finish_pss", pss, fed(20), finish},
      {"soter_finish_that_creates_the_counter", key,
       [](stage& on) {
         without_a_counter(on);
         fed(20)(on);
       },
       finish, states_the_message},
      {"soter_finish_of_no_text",
       key,
       [](stage& on) {
         begin_signing(on);
         EXPECT_TRUE(on.client().update(on.handle, {0xC0, 0xAF}).ok());
       },
       finish,
       {},
       TEEC_SUCCESS,
       KM_ERROR_UNKNOWN_ERROR},
  };
}

}  // namespace

std::vector<scenario> soter_scenarios() {
  std::vector<scenario> all = service_scenarios();
  for (auto& some : {export_scenarios(), sign_scenarios()}) all.insert(all.end(), some.begin(), some.end());
  return all;
}

}  // namespace testing_support
