// Properties: typed values by name, and each as text.
#ifndef TEE_RUNTIME_PROPERTY_H_
#define TEE_RUNTIME_PROPERTY_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "tee/runtime/instance.h"

namespace hosted_tee {

using binary_block = std::vector<std::uint8_t>;
using property_value = std::variant<bool, std::uint32_t, std::string, TEE_UUID, TEE_Identity, binary_block>;

/// find_property looks `name` up in the set as `self` sees it. Nothing: the set has no such property. An unknown set is
/// a programmer error.
[[nodiscard]] std::optional<property_value> find_property(const instance& self, TEE_PropSetHandle set,
                                                          std::string_view name);

/// property_text gives the text form of Internal Core API 1.1.2, 4.4.2.1.
[[nodiscard]] std::string property_text(const property_value& value);

/// The names of TEE_PROPSET_TEE_IMPLEMENTATION whose text a device's settings may replace.
[[nodiscard]] bool is_settable_property(std::string_view name);

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_PROPERTY_H_
