// Small persistent objects of a companion (TEE_STORAGE_PRIVATE), which are read and written whole.
#ifndef TEE_COMPANIONS_COMMON_STORED_OBJECT_H_
#define TEE_COMPANIONS_COMMON_STORED_OBJECT_H_

#include <cstdint>
#include <span>
#include <string_view>

#include "platform/bytes.h"

namespace keymaster::companion {

/// is_stored tells in `*there` whether there is an object of this name. The platform's result otherwise, and `*there`
/// is false.
[[nodiscard]] TEE_Result is_stored(std::string_view name, bool* there);

/// read_stored reads an object of up to `limit` bytes into `data`. TEE_ERROR_ITEM_NOT_FOUND: there is none;
/// TEE_ERROR_OUT_OF_MEMORY; otherwise the platform's result. `data` is empty then.
[[nodiscard]] TEE_Result read_stored(std::string_view name, uint32_t limit, secret_bytes& data);

/// write_stored makes or replaces the object, in one step of the platform: after a failure, or a loss of power, there
/// is the old object (or none) or the new one whole. The platform's result. `data` is the TA's own memory: what the
/// normal world can change is copied first.
[[nodiscard]] TEE_Result write_stored(std::string_view name, std::span<const uint8_t> data);

}  // namespace keymaster::companion

#endif  // TEE_COMPANIONS_COMMON_STORED_OBJECT_H_
