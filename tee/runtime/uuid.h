// UUIDs in their three forms: the API's record, 16 bytes in network order, and text.
#ifndef TEE_RUNTIME_UUID_H_
#define TEE_RUNTIME_UUID_H_

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "tee_api_types.h"

namespace hosted_tee {

using uuid_bytes = std::array<std::uint8_t, 16>;

[[nodiscard]] uuid_bytes to_bytes(const TEE_UUID& uuid);
[[nodiscard]] TEE_UUID from_bytes(const uuid_bytes& bytes);

/// to_text gives the 36 characters of RFC 4122 in lower case; parse_uuid takes them in either case, and nothing else.
[[nodiscard]] std::string to_text(const TEE_UUID& uuid);
[[nodiscard]] std::optional<TEE_UUID> parse_uuid(std::string_view text);

[[nodiscard]] bool same_uuid(const TEE_UUID& a, const TEE_UUID& b);

/// random_uuid draws a version 4 UUID; named_uuid derives the version 5 UUID of `name` in this system's name space.
[[nodiscard]] TEE_UUID random_uuid();
[[nodiscard]] TEE_UUID named_uuid(std::string_view name);

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_UUID_H_
