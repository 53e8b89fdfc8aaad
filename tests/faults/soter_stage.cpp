#include "tests/faults/soter_stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t status_and_response =
    TEEC_PARAM_TYPES(TEEC_VALUE_OUTPUT, TEEC_NONE, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE);

}  // namespace

param_list soter_attk_key() {
  return rsa_key(1024)
      .add(KM_TAG_SOTER_KEY)
      .add(KM_TAG_SOTER_SIGNED_BY_ATTK)
      .add(KM_TAG_SOTER_COUNTED)
      .add(KM_TAG_SOTER_UID, soter_uid);
}

answer soter_generate(stage& on) {
  return on.client().call(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR, 0, 0, std::nullopt, std::nullopt);
}

answer soter_verify(stage& on) {
  return on.client().call(KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR, 0, 0, std::nullopt, std::nullopt);
}

answer soter_export_attk(stage& on) {
  return on.client().call_types(KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, status_and_response, 0, 0, {}, 600);
}

answer soter_device_id(stage& on) {
  return on.client().call_types(KM_COMMAND_SOTER_GET_DEVICE_ID, status_and_response, 0, 0, {}, 64);
}

soter_statement statement_in(const bytes& packed) {
  const auto text = packed.begin() + 4;
  const auto end = text + static_cast<std::ptrdiff_t>(u32_at(packed, 0));
  return {{text, end}, {end, packed.end()}};
}

std::uint64_t soter_statement::counter() const {
  const std::string name = "\"counter\":";
  const std::size_t at = text.find(name);
  return at == std::string::npos ? 0 : std::stoull(text.substr(at + name.size()));
}

bool soter_statement::signed_by(const rsa_test_key& key) const {
  return key.verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, from_text(text), signature);
}

}  // namespace testing_support
