#include "tee/runtime/property.h"

#include <openssl/evp.h>

#include <algorithm>
#include <array>
#include <utility>

#include "tee/runtime/device.h"
#include "tee/runtime/platform_call.h"
#include "tee/runtime/uuid.h"

namespace hosted_tee {
namespace {

constexpr std::uint32_t protected_by_ree = 100;  // a protection level: the normal world's clock can be set at will

constexpr std::array<std::pair<std::string_view, std::string_view>, 6> texts{{
    {"gpd.tee.apiversion", "1.1"},
    {"gpd.tee.description", "Hosted TEE for development and tests, no security boundary"},
    {"gpd.tee.trustedos.manufacturer", "Keymaster TA project"},
    {"gpd.tee.trustedos.implementation.version", HOSTED_TEE_VERSION},
    {"gpd.tee.firmware.manufacturer", "none"},
    {"gpd.tee.firmware.implementation.version", "none"},
}};

constexpr std::array<std::pair<std::string_view, std::uint32_t>, 5> numbers{{
    {"gpd.tee.internalCore.version", 0x01010200},  // 1.1.2, a byte a part
    {"gpd.tee.systemTime.protectionLevel", protected_by_ree},
    {"gpd.tee.TAPersistentTime.protectionLevel", protected_by_ree},
    {"gpd.tee.trustedStorage.antiRollback.protectionLevel", 0},  // of the private storage: none
    {"gpd.tee.arith.maxBigIntSize", 0},                          // there is no arithmetical API
}};

constexpr std::array<std::pair<std::string_view, bool>, 1> booleans{{{"gpd.tee.cryptography.ecc", true}}};

constexpr std::array<std::string_view, 2> binary_versions{"gpd.tee.trustedos.implementation.binaryversion",
                                                          "gpd.tee.firmware.implementation.binaryversion"};

template <class Table>
const typename Table::value_type* row(const Table& table, std::string_view name) {
  const auto found = std::find_if(table.begin(), table.end(), [&](const auto& entry) { return entry.first == name; });
  return found == table.end() ? nullptr : &*found;
}

std::optional<property_value> of_implementation(const device_services& device, std::string_view name) {
  if (name == "gpd.tee.deviceID") return device.id;
  if (const auto set = device.text_properties.find(name); set != device.text_properties.end()) return set->second;
  if (const auto* text = row(texts, name)) return std::string(text->second);
  if (const auto* number = row(numbers, name)) return number->second;
  if (const auto* boolean = row(booleans, name)) return boolean->second;
  if (std::find(binary_versions.begin(), binary_versions.end(), name) != binary_versions.end()) {
    constexpr std::string_view version = HOSTED_TEE_VERSION;
    return binary_block(version.begin(), version.end());
  }
  return std::nullopt;
}

property_value value_of(const tee_ta_property& property) {
  switch (property.type) {
    case TEE_TA_PROPERTY_BOOL:
      return property.number != 0;
    case TEE_TA_PROPERTY_U32:
      return property.number;
    default:
      return std::string(property.text == nullptr ? "" : property.text);
  }
}

std::string base64(const binary_block& block) {
  std::string text((block.size() + 2) / 3 * 4, '\0');
  EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data()), block.data(), static_cast<int>(block.size()));
  return text;
}

bool is_nil(const TEE_UUID& uuid) {
  return same_uuid(uuid, TEE_UUID{});
}

struct text_maker {
  std::string operator()(bool value) const { return value ? "true" : "false"; }
  std::string operator()(std::uint32_t value) const { return std::to_string(value); }
  std::string operator()(const std::string& value) const { return value; }
  std::string operator()(const TEE_UUID& value) const { return to_text(value); }
  std::string operator()(const binary_block& value) const { return base64(value); }
  std::string operator()(const TEE_Identity& value) const {
    const std::string login = std::to_string(value.login);
    return is_nil(value.uuid) ? login : login + ":" + to_text(value.uuid);
  }
};

}  // namespace

std::optional<property_value> find_property(const instance& self, TEE_PropSetHandle set, std::string_view name) {
  if (set == TEE_PROPSET_TEE_IMPLEMENTATION) return of_implementation(self.device, name);
  if (set == TEE_PROPSET_CURRENT_TA) return find_ta_property(self.uuid, self.properties, name);
  if (set != TEE_PROPSET_CURRENT_CLIENT) panic("the property set is none of the three");
  if (name == "gpd.client.identity") return self.client;
  return std::nullopt;
}

std::optional<property_value> find_ta_property(const TEE_UUID& ta, const tee_ta_property* table,
                                               std::string_view name) {
  if (name == "gpd.ta.appID") return ta;
  for (const tee_ta_property* p = table; p != nullptr && p->name != nullptr; ++p) {
    if (name == p->name) return value_of(*p);
  }
  return std::nullopt;
}

std::string property_text(const property_value& value) {
  return std::visit(text_maker{}, value);
}

bool is_settable_property(std::string_view name) {
  return row(texts, name) != nullptr;
}

}  // namespace hosted_tee
