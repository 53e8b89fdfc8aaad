#include "tests/support/played_quil.h"

#include <cstring>

#include "src/params/keymaster_protocol.h"

namespace testing_support {
namespace {

constexpr TEE_UUID keymaster_uuid = KEYMASTER_TA_UUID;
constexpr TEE_UUID quil_ta = {0xd625ee97, 0xfb6f, 0x4498, {0xb2, 0x82, 0xa3, 0xf8, 0x5d, 0x94, 0x13, 0xc5}};
constexpr std::uint32_t the_session = 5;

bool same(const TEE_UUID& a, const TEE_UUID& b) {
  return std::memcmp(&a, &b, sizeof a) == 0;
}

/// Copies what fits and tells the whole length, as a provisioning TA does.
TEE_Result answer_with(const played_quil::response& response, TEE_Param& target, std::uint32_t& length) {
  if (response.result != TEE_SUCCESS) return response.result;
  const bool fits = response.data.size() <= target.memref.size;
  length = response.length.value_or(static_cast<std::uint32_t>(response.data.size()));
  if (!fits) return TEE_ERROR_SHORT_BUFFER;
  if (!response.data.empty()) std::memcpy(target.memref.buffer, response.data.data(), response.data.size());
  return TEE_SUCCESS;
}

}  // namespace

bytes tlv(std::uint16_t tag, const bytes& value) {
  return join({{static_cast<std::uint8_t>(tag), static_cast<std::uint8_t>(tag >> 8),
                static_cast<std::uint8_t>(value.size()), static_cast<std::uint8_t>(value.size() >> 8)},
               value});
}

bytes text_with_nul(std::string_view text) {
  return join({from_text(text), {0}});
}

bytes attestation_key_box(const rsa_components& key, std::size_t components) {
  bytes box;
  for (std::size_t i = 0; i < components; ++i) box = join({box, tlv(static_cast<std::uint16_t>(17 + i), key.at(i))});
  return box;
}

bytes soter_property_box(const TEE_UUID& finger_ta) {
  bytes uuid(sizeof finger_ta);
  std::memcpy(uuid.data(), &finger_ta, uuid.size());
  return join({tlv(0x1835, text_with_nul("sensor/1")), tlv(0x1836, text_with_nul("2.0")), tlv(0x1837, uuid)});
}

void played_quil::provision(const rsa_components& attestation_key) {
  key.data = attestation_key_box(attestation_key);
  properties[soter_property].data = soter_property_box();
  properties[cpu_id_property].data = from_text("CPU0123");
  properties[device_id_property].data = pattern(32);
}

void played_quil::expect(bool holds, const char* complaint) {
  if (!holds) complaints.emplace_back(complaint);
}

TEE_Result played_quil::open_nested(const TEE_UUID& ta, const TEE_Identity& client, std::uint32_t param_types,
                                    TEE_Param* /*params*/, std::uint32_t& session, std::uint32_t& origin) {
  origin = TEE_ORIGIN_TRUSTED_APP;
  expect(same(ta, quil_ta), "another TA is meant");
  expect(client.login == TEE_LOGIN_TRUSTED_APP && same(client.uuid, keymaster_uuid), "another TA calls");
  expect(param_types == 0, "the session has parameters");
  if (opens != TEE_SUCCESS) return opens;
  ++open_sessions;
  session = the_session;
  return TEE_SUCCESS;
}

TEE_Result played_quil::invoke_nested(std::uint32_t session, std::uint32_t command, std::uint32_t param_types,
                                      TEE_Param params[4], std::uint32_t& origin) {
  origin = TEE_ORIGIN_TRUSTED_APP;
  expect(session == the_session && open_sessions == 1, "the session is not open");
  types.push_back(param_types);
  if (command == 2 || command == 5) {
    calls.push_back(std::to_string(command));
    capacities.push_back(params[0].memref.size);
    expect(params[1].value.a == 0, "the length is not cleared");
    return answer_with(command == 2 ? key : data, params[0], params[1].value.a);
  }
  const auto* const request = static_cast<const std::uint8_t*>(params[0].memref.buffer);
  const std::string asked = to_hex({request, params[0].memref.size});
  calls.push_back(std::to_string(command) + " " + asked);
  capacities.push_back(params[1].memref.size);
  const auto found = properties.find(asked);
  if (found == properties.end()) return TEE_ERROR_ITEM_NOT_FOUND;
  return answer_with(found->second, params[1], params[1].memref.size);
}

void played_quil::close_nested(std::uint32_t session) {
  expect(session == the_session, "another session is closed");
  --open_sessions;
}

}  // namespace testing_support
