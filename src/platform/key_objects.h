// Key objects and operations, made in the platform's several steps, with the trace line that belongs to each. The
// results are the platform's; what a failure leaves half made goes with its owner.
#ifndef KEYMASTER_PLATFORM_KEY_OBJECTS_H_
#define KEYMASTER_PLATFORM_KEY_OBJECTS_H_

#include <cstdint>
#include <span>

#include "platform/handles.h"

namespace keymaster {

/// populate_object makes an object of `type` and `bits` from `attributes`.
[[nodiscard]] TEE_Result populate_object(uint32_t type, uint32_t bits, std::span<const TEE_Attribute> attributes,
                                         object_handle& object);

/// generate_object makes an object of `type` and `bits` with a fresh key; `parameters` is what the kind of key asks
/// for.
[[nodiscard]] TEE_Result generate_object(uint32_t type, uint32_t bits, std::span<const TEE_Attribute> parameters,
                                         object_handle& object);

/// make_secret_object makes an object of `type` and `bits` whose one value (TEE_ATTR_SECRET_VALUE) is `value`.
[[nodiscard]] TEE_Result make_secret_object(uint32_t type, uint32_t bits, std::span<const uint8_t> value,
                                            object_handle& object);

/// read_attribute reads a value of the object into `place`; `*length` is what the platform says of its length.
[[nodiscard]] TEE_Result read_attribute(const object_handle& object, uint32_t attribute, std::span<uint8_t> place,
                                        uint32_t* length);

/// make_operation makes an operation for keys of `bits` and gives it `key`.
[[nodiscard]] TEE_Result make_operation(uint32_t algorithm, uint32_t mode, uint32_t bits, const object_handle& key,
                                        operation_handle& operation);

/// make_digest_operation makes an operation that needs no key.
[[nodiscard]] TEE_Result make_digest_operation(uint32_t algorithm, operation_handle& operation);

}  // namespace keymaster

#endif  // KEYMASTER_PLATFORM_KEY_OBJECTS_H_
