// The properties of the TEE and of a TA, as kmctl info shows them.
#ifndef KEYMASTER_CLIENT_KMCTL_DEVICE_PROPERTIES_H_
#define KEYMASTER_CLIENT_KMCTL_DEVICE_PROPERTIES_H_

#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "client/lib/device_information.h"

namespace kmctl {

/// Names with values, in the order in which they are shown. Nothing for a value: there is no such property.
using property_list = std::vector<std::pair<std::string_view, std::optional<std::string>>>;

/// What was read. Without a state the TEE has no TA to ask, the lists are empty and `refusal` says what it answered.
struct device_properties {
  std::optional<keymaster::client::device_state> state;
  property_list tee;
  property_list ta;
  std::string refusal;
};

/// read_properties asks the TEE behind `tee` for its properties and for those of the TA `ta`. A TEE that has no TA to
/// ask is no error; what else fails throws keymaster::client::error.
[[nodiscard]] device_properties read_properties(keymaster::client::connection& tee, const TEEC_UUID& ta);

/// tee_text and ta_text give one line per fact, each behind a line break and two blanks.
[[nodiscard]] std::string tee_text(const device_properties& properties);
[[nodiscard]] std::string ta_text(const device_properties& properties);

/// properties_json gives the members "tee_properties" and "ta_properties" (text by name), "rpmb", "system_time_ms" and
/// "ree_time" (ISO 8601). What could not be read is null.
[[nodiscard]] nlohmann::ordered_json properties_json(const device_properties& properties);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_DEVICE_PROPERTIES_H_
