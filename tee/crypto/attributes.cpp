#include "tee/crypto/attributes.h"

#include <algorithm>

namespace hosted_tee {

attribute_view::attribute_view(const TEE_Attribute* attributes, std::uint32_t count) : attributes_(attributes, count) {
  refuse_unless(attributes != nullptr || count == 0, TEE_ERROR_BAD_PARAMETERS);
}

const TEE_Attribute* attribute_view::find(std::uint32_t id) const {
  const auto found =
      std::find_if(attributes_.begin(), attributes_.end(), [&](const auto& each) { return each.attributeID == id; });
  return found == attributes_.end() ? nullptr : &*found;
}

bytes_view attribute_view::bytes(std::uint32_t id) const {
  const TEE_Attribute* const attribute = find(id);
  return input(attribute->content.ref.buffer, attribute->content.ref.length);
}

bool attribute_view::is_made_of(std::span<const std::uint32_t> required,
                                std::span<const std::uint32_t> together) const {
  const auto present = [&](std::uint32_t id) { return has(id); };
  if (!std::all_of(required.begin(), required.end(), present)) return false;
  if (attributes_.size() == required.size()) return true;
  return attributes_.size() == required.size() + together.size() &&
         std::all_of(together.begin(), together.end(), present);
}

}  // namespace hosted_tee
