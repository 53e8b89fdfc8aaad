// Scenarios of the key commands.
#include <gtest/gtest.h>

#include "tests/faults/stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

// 512 bits: a small key is generated in no time, and the size changes nothing of what is called.
const param_list& small_key() {
  static const param_list params = rsa_key(512);
  return params;
}

void nothing(stage&) {}
void fixed_key(stage& on) {
  on.import();
}
void key_of_an_application(stage& on) {
  on.import(rsa_key(1024)
                .add_blob(KM_TAG_APPLICATION_ID, from_text("id"))
                .add_blob(KM_TAG_APPLICATION_DATA, from_text("data"))
                .add_blob(KM_TAG_ASSOCIATED_DATA, pattern(20)));
}

void expect_usable(stage& on, const answer& made) {
  EXPECT_TRUE(on.client().characteristics_size(made.body()).ok());
}
void expect_imported(stage& on, const answer& made) {
  const bytes blob(made.output.begin() + 4, made.output.begin() + 4 + u32_at(made.output, 0));
  EXPECT_EQ(on.client().export_key(blob).body(), on.key.spki());
}

std::vector<scenario> making_scenarios() {
  return {
      {"generate",
       nothing,
       {},
       [](stage& on) { return on.client().generate(small_key(), 2048); },
       expect_usable,
       TEEC_SUCCESS,
       0,
       true},
      {"generate_without_room",
       nothing,
       {},
       [](stage& on) { return on.client().generate(small_key(), 300); },
       {},
       TEEC_ERROR_SHORT_BUFFER,
       KM_ERROR_UNKNOWN_ERROR,
       true},
      {"generate_for_an_unknown_algorithm",
       nothing,
       {},
       [](stage& on) { return on.client().generate(param_list{}.add(KM_TAG_ALGORITHM, 2), 64); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_UNSUPPORTED_ALGORITHM,
       true},
      {"generate_with_two_blob_usages",
       nothing,
       {},
       [](stage& on) {
         param_list params = small_key();
         return on.client().generate(params.add(KM_TAG_BLOB_USAGE_REQUIREMENTS).add(KM_TAG_BLOB_USAGE_REQUIREMENTS),
                                     2048);
       },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_TAG,
       true},
      {"import",
       nothing,
       {},
       [](stage& on) { return on.client().import_key(rsa_key(1024), on.key.material(), 4096); },
       expect_imported,
       TEEC_SUCCESS,
       0,
       true},
      {"import_with_size_and_exponent_unsaid",
       nothing,
       {},
       [](stage& on) {
         return on.client().import_key(rsa_key(1024).remove(KM_TAG_KEY_SIZE).remove(KM_TAG_RSA_PUBLIC_EXPONENT),
                                       on.key.material(), 4096);
       },
       expect_imported,
       TEEC_SUCCESS,
       0,
       true},
      {"import_without_rpmb",
       nothing,
       {},
       [](stage& on) { return on.client().import_key(rsa_key(1024), on.key.material(), 4096); },
       expect_imported,
       TEEC_SUCCESS,
       0,
       true,
       false},
      {"import_without_room_for_the_characteristics",
       nothing,
       {},
       [](stage& on) {
         const std::size_t total = 8 + 101 + 4 + on.key.material().size() + 2 * (rsa_key(1024).marshal().size() + 24);
         return on.client().import_key(rsa_key(1024), on.key.material(), total - 1);
       },
       {},
       TEEC_ERROR_SHORT_BUFFER,
       KM_ERROR_UNKNOWN_ERROR,
       true},
      {"import_of_another_size_than_said",
       nothing,
       {},
       [](stage& on) { return on.client().import_key(rsa_key(2048), on.key.material(), 4096); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_IMPORT_PARAMETER_MISMATCH,
       true},
      {"import_of_half_a_key",
       nothing,
       {},
       [](stage& on) { return on.client().import_key(rsa_key(1024), on.key.component(rsa_n), 4096); },
       {},
       TEEC_ERROR_GENERIC,
       KM_ERROR_UNKNOWN_ERROR,
       true},
  };
}

std::vector<scenario> reading_scenarios() {
  const auto same_spki = [](stage& on, const answer& got) { EXPECT_EQ(got.body(), on.key.spki()); };
  return {
      {"character_size",
       fixed_key,
       {},
       [](stage& on) { return on.client().characteristics_size(on.blob); },
       [](stage&, const answer& got) { EXPECT_EQ(got.b, rsa_key(1024).marshal().size() + 24); }},
      {"character",
       fixed_key,
       {},
       [](stage& on) { return on.client().characteristics(on.blob); },
       [](stage&, const answer& got) { EXPECT_TRUE(param_list::parse(got.body()).has_value()); }},
      {"character_without_rpmb",
       fixed_key,
       {},
       [](stage& on) { return on.client().characteristics(on.blob); },
       {},
       TEEC_SUCCESS,
       0,
       false,
       false},
      {"character_for_an_application",
       key_of_an_application,
       {},
       [](stage& on) { return on.client().characteristics(on.blob, from_text("id"), from_text("data")); }},
      {"character_for_the_wrong_application",
       key_of_an_application,
       {},
       [](stage& on) { return on.client().characteristics(on.blob, from_text("id"), from_text("dada")); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_KEY_BLOB},
      {"character_without_room",
       fixed_key,
       {},
       [](stage& on) { return on.client().characteristics(on.blob, {}, {}, 27); },
       {},
       TEEC_ERROR_SHORT_BUFFER,
       KM_ERROR_UNKNOWN_ERROR},
      {"character_of_a_forged_blob",
       fixed_key,
       {},
       [](stage& on) { return on.client().characteristics(flip(on.blob, 300)); },
       {},
       0xFFFF3071,
       KM_ERROR_UNKNOWN_ERROR},
      {"character_size_of_a_short_blob",
       nothing,
       {},
       [](stage& on) { return on.client().characteristics_size(bytes(93)); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_KEY_BLOB},
      {"export", fixed_key, {}, [](stage& on) { return on.client().export_key(on.blob); }, same_spki},
      {"export_without_room",
       fixed_key,
       {},
       [](stage& on) { return on.client().export_key(on.blob, {}, {}, 50); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_UNKNOWN_ERROR},
      {"export_of_a_soter_key",
       [](stage& on) { on.import(rsa_key(1024).add(KM_TAG_SOTER_KEY)); },
       {},
       [](stage& on) { return on.client().export_key(on.blob); },
       {},
       TEEC_ERROR_BAD_PARAMETERS,
       KM_ERROR_UNKNOWN_ERROR},
      {"delete", fixed_key, {}, [](stage& on) { return on.client().delete_key(on.blob); }},
      {"delete_of_no_blob",
       nothing,
       {},
       [](stage& on) { return on.client().delete_key({}); },
       {},
       TEEC_SUCCESS,
       KM_ERROR_INVALID_KEY_BLOB},
      {"delete_all", nothing, {}, [](stage& on) { return on.client().delete_all(); }},
  };
}

}  // namespace

std::vector<scenario> key_scenarios() {
  std::vector<scenario> all = making_scenarios();
  for (scenario& each : reading_scenarios()) all.push_back(std::move(each));
  return all;
}

}  // namespace testing_support
