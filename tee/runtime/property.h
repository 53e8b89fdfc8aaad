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

/// get_ta_property is TEE_GetPropertyAsString for the properties of the TA `ta`, read from its image: the TA need not
/// run, and does not run for it. A platform call, for the platform's own TAs. Errors: TEE_ERROR_ITEM_NOT_FOUND (no such
/// TA, or it has no such property), TEE_ERROR_BAD_FORMAT (what lies there is not an image of that TA; the trace tells
/// why), TEE_ERROR_SHORT_BUFFER (`*length` is the size that is needed).
[[nodiscard]] TEE_Result get_ta_property(const TEE_UUID& ta, const char* name, char* value, std::uint32_t* length);

/// find_ta_property looks `name` up among the properties of the TA `ta`, whose image has `table`.
[[nodiscard]] std::optional<property_value> find_ta_property(const TEE_UUID& ta, const tee_ta_property* table,
                                                             std::string_view name);

/// property_text gives the text form of Internal Core API 1.1.2, 4.4.2.1.
[[nodiscard]] std::string property_text(const property_value& value);

/// The names of TEE_PROPSET_TEE_IMPLEMENTATION whose text a device's settings may replace.
[[nodiscard]] bool is_settable_property(std::string_view name);

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_PROPERTY_H_
