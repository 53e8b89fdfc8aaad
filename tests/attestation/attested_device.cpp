#include "tests/attestation/attested_device.h"

#include "tee/companions/fingerprint/fingerprint_protocol.h"
#include "tee/companions/provisioning/provisioning_protocol.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr TEE_UUID provisioning_uuid = QUIL_TA_UUID;
constexpr TEE_UUID fingerprint_uuid = FINGERPRINT_TA_UUID;

bytes entry(std::uint16_t tag, const bytes& value) {
  const auto half = [](std::size_t number) {
    return bytes{static_cast<std::uint8_t>(number), static_cast<std::uint8_t>(number >> 8)};
  };
  return join({half(tag), half(value.size()), value});
}

bytes with_nul(std::string_view text) {
  return join({from_text(text), {0}});
}

bytes key_box() {
  const auto& key = rsa_test_key::of_bits(2048);
  bytes box;
  constexpr std::pair<std::uint16_t, rsa_component> rows[] = {{17, rsa_n}, {18, rsa_e},  {19, rsa_d},  {20, rsa_p},
                                                              {21, rsa_q}, {22, rsa_dp}, {23, rsa_dq}, {24, rsa_qinv}};
  for (const auto& [tag, component] : rows) box = join({box, entry(tag, key.component(component))});
  return box;
}

/// The fingerprint TA's UUID as it lies in memory, on this little-endian processor and on the device's.
bytes uuid_in_memory() {
  const auto* const first = reinterpret_cast<const std::uint8_t*>(&fingerprint_uuid);
  return {first, first + sizeof fingerprint_uuid};
}

}  // namespace

nlohmann::ordered_json statement::json() const {
  const auto end = !text.empty() && text.back() == 0 ? text.end() - 1 : text.end();
  return nlohmann::ordered_json::parse(text.begin(), end);
}

std::vector<std::string> statement::members() const {
  std::vector<std::string> names;
  const nlohmann::ordered_json object = json();
  for (const auto& [name, value] : object.items()) names.push_back(name);
  return names;
}

statement take_apart(const bytes& data, std::size_t signature_size) {
  statement parts;
  if (data.size() < 4 + signature_size) {
    ADD_FAILURE() << "a statement of " << data.size() << " bytes";
    return parts;
  }
  parts.length = u32_at(data, 0);
  const auto cut = data.end() - static_cast<std::ptrdiff_t>(signature_size);
  parts.text.assign(data.begin() + 4, cut);
  parts.signature.assign(cut, data.end());
  EXPECT_EQ(parts.length, parts.text.size());
  return parts;
}

void AttestationTest::provision() {
  companion_session factory(tee.world(), provisioning_uuid);
  const auto put_property = [&](const bytes& request, bytes value) {
    bytes asked = request;
    TEE_Param params[4] = {memory_slot(asked), memory_slot(value), {}, {}};
    ASSERT_EQ(factory.invoke(provisioning::COMMAND_PUT_PROPERTY, 0x55, params), TEE_SUCCESS);
  };
  bytes box = key_box();
  TEE_Param params[4] = {memory_slot(box), {}, {}, {}};
  ASSERT_EQ(factory.invoke(provisioning::COMMAND_PUT_KEY, 0x5, params), TEE_SUCCESS);
  put_property(from_hex("34180000"), join({entry(0x1835, with_nul("sensor/1")), entry(0x1836, with_nul("v2")),
                                           entry(0x1837, uuid_in_memory())}));
  put_property(from_hex("34173a17"), from_text("CPU-0001"));
  put_property(from_hex("34193619"), pattern(16));
}

std::int32_t AttestationTest::soter_command(std::uint32_t command, bytes* out) {
  answer got = out == nullptr ? client().call(command, 0, 0, std::nullopt, std::nullopt)
                              : client().call_types(command, 0x602, 0, 0, {}, out->size());
  EXPECT_EQ(got.result, TEEC_SUCCESS);
  if (out != nullptr) *out = got.body();
  return got.error;
}

std::uint32_t AttestationTest::enrol_finger(std::uint64_t user) {
  companion_session sensor(tee.world(), fingerprint_uuid);
  TEE_Param params[4] = {wide_slot(user), {}, {}, {}};
  EXPECT_EQ(sensor.invoke(fingerprint::COMMAND_ENROL, 0x21, params), TEE_SUCCESS);
  return params[1].value.a;
}

AttestationTest::touched AttestationTest::touch(std::uint32_t finger, std::uint64_t challenge) {
  companion_session sensor(tee.world(), fingerprint_uuid);
  bytes token(69, canary);
  TEE_Param params[4] = {value_slot(finger), wide_slot(challenge), memory_slot(token), {}};
  const TEE_Result result = sensor.invoke(fingerprint::COMMAND_TOUCH, 0x2611, params);
  return {result, token, params[3].value.a};
}

bytes AttestationTest::soter_key(unsigned bits, const param_list& tags) {
  return import_fixed(bits, rsa_key(bits).add(KM_TAG_SOTER_KEY).add(tags));
}

statement AttestationTest::exported(const bytes& blob, std::size_t signature_size) {
  const answer got = succeeds([&] { return client().export_key(blob); });
  return take_apart(got.body(), signature_size);
}

statement AttestationTest::signed_statement(const bytes& blob, const param_list& scheme, std::string_view raw,
                                            std::size_t signature_size) {
  const finish_answer got = succeeds([&] { return client().sign(blob, scheme, from_text(raw)); });
  return take_apart(got.data, signature_size);
}

bool AttestationTest::openssl_verifies(const std::string& pem, const bytes& text, const bytes& signature,
                                       const std::vector<std::string>& options) {
  write_file(tee.folder() / "signer.pem", from_text(pem));
  write_file(tee.folder() / "text", text);
  write_file(tee.folder() / "signature", signature);
  std::vector<std::string> arguments{"dgst", "-sha256", "-verify", "signer.pem", "-signature", "signature"};
  arguments.insert(arguments.end(), options.begin(), options.end());
  arguments.emplace_back("text");
  return openssl(tee.folder(), arguments).status == 0;
}

std::optional<std::uint64_t> AttestationTest::stored_counter() {
  const auto content = tee.world().read_object(keymaster_ta, TEE_STORAGE_PRIVATE, {"SOTER_COUNTER_OBJECT\0", 21});
  if (!content || content->size() != 8) return std::nullopt;
  std::uint64_t counter = 0;
  for (std::size_t i = 8; i-- > 0;) counter = counter << 8 | static_cast<std::uint8_t>((*content)[i]);
  return counter;
}

}  // namespace testing_support
