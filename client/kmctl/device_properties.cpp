#include "client/kmctl/device_properties.h"

#include <fmt/format.h>

#include <array>

#include "client/kmctl/values.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using nlohmann::ordered_json;

constexpr std::array<std::string_view, 5> tee_names{
    "gpd.tee.apiversion",
    "gpd.tee.description",
    "gpd.tee.deviceID",
    "gpd.tee.trustedos.manufacturer",
    "gpd.tee.trustedos.implementation.version",
};

constexpr std::array<std::string_view, 7> ta_names{
    "gpd.ta.singleInstance", "gpd.ta.multiSession", "gpd.ta.instanceKeepAlive", "gpd.ta.dataSize",
    "gpd.ta.stackSize",      "gpd.ta.version",      "gpd.ta.description",
};

std::string line(std::string_view name, std::string_view value) {
  return fmt::format("\n  {:<42}{}", name, value);
}

std::string list_text(const device_properties& properties, const property_list& list) {
  if (!properties.state) {
    return fmt::format("\n  properties are not available: this TEE offers no TA that tells them ({})",
                       properties.refusal);
  }
  std::string text;
  for (const auto& [name, value] : list) {
    text += line(name, value.value_or("(none)"));
  }
  return text;
}

ordered_json list_json(const device_properties& properties, const property_list& list) {
  if (!properties.state) {
    return nullptr;
  }
  ordered_json object = ordered_json::object();
  for (const auto& [name, value] : list) {
    object[std::string(name)] = value ? ordered_json(*value) : ordered_json(nullptr);
  }
  return object;
}

}  // namespace

device_properties read_properties(client::connection& tee, const TEEC_UUID& ta) {
  device_properties all;
  std::optional<client::device_information> information;
  try {
    information.emplace(tee);
  } catch (const client::error& refused) {
    all.refusal = client::tee_result_name(refused.facts().tee_result);
    return all;
  }
  all.state = information->state();
  for (const auto name : tee_names) {
    all.tee.emplace_back(name, information->tee_property(name));
  }
  for (const auto name : ta_names) {
    all.ta.emplace_back(name, information->ta_property(ta, name));
  }
  return all;
}

std::string tee_text(const device_properties& properties) {
  std::string text = list_text(properties, properties.tee);
  if (const auto& state = properties.state) {
    text += line("RPMB storage", state->has_rpmb ? "yes" : "no");
    text += line("system time", fmt::format("{}.{:03} s", state->system_time / 1000, state->system_time % 1000));
    text += line("REE time", format_date(state->ree_time));
  }
  return text;
}

std::string ta_text(const device_properties& properties) {
  return list_text(properties, properties.ta);
}

ordered_json properties_json(const device_properties& properties) {
  const auto& state = properties.state;
  return {{"tee_properties", list_json(properties, properties.tee)},
          {"ta_properties", list_json(properties, properties.ta)},
          {"rpmb", state ? ordered_json(state->has_rpmb) : ordered_json(nullptr)},
          {"system_time_ms", state ? ordered_json(state->system_time) : ordered_json(nullptr)},
          {"ree_time", state ? ordered_json(format_date(state->ree_time)) : ordered_json(nullptr)}};
}

}  // namespace kmctl
