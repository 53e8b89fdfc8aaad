// Key objects that hold one secret value, as AES, HMAC and the key storage use them.
#ifndef KEYMASTER_PLATFORM_KEY_OBJECTS_H_
#define KEYMASTER_PLATFORM_KEY_OBJECTS_H_

#include <cstdint>
#include <span>

#include "platform/handles.h"

namespace keymaster {

/// make_secret_object makes an object of `type` and `bits` whose TEE_ATTR_SECRET_VALUE is `value`. The result is the
/// platform's; failures are traced, and leave `object` to be freed by its owner.
[[nodiscard]] TEE_Result make_secret_object(uint32_t type, uint32_t bits, std::span<const uint8_t> value,
                                            object_handle& object);

/// generate_secret_object makes an object of `type` and `bits` with a random value.
[[nodiscard]] TEE_Result generate_secret_object(uint32_t type, uint32_t bits, object_handle& object);

/// read_secret_value reads the object's value into `value`; `*length` is what the platform says of its length.
[[nodiscard]] TEE_Result read_secret_value(const object_handle& object, std::span<uint8_t> value, uint32_t* length);

}  // namespace keymaster

#endif  // KEYMASTER_PLATFORM_KEY_OBJECTS_H_
