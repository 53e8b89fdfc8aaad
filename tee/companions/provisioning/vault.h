// What the provisioning TA keeps: the attestation key, data, properties, and the lock, each an object of its own.
#ifndef TEE_COMPANIONS_PROVISIONING_VAULT_H_
#define TEE_COMPANIONS_PROVISIONING_VAULT_H_

#include <cstdint>
#include <string_view>

#include "quil/quil_protocol.h"
#include "tee/companions/common/object_name.h"

namespace keymaster::provisioning {

inline constexpr std::string_view key_name = "quil.key";
inline constexpr std::string_view data_name = "quil.data";

/// property_name answers the name of the object that holds the property.
[[nodiscard]] companion::object_name property_name(const quil_property_request& property);

/// is_locked tells whether the device is locked. The platform's result when that can't be found out; `*locked` is true
/// then.
[[nodiscard]] TEE_Result is_locked(bool* locked);

/// lock locks the device, for good; it stays locked when it is already. The platform's result.
[[nodiscard]] TEE_Result lock();

/// find_status answers a mask of status_t. The platform's result.
[[nodiscard]] TEE_Result find_status(uint32_t* status);

}  // namespace keymaster::provisioning

#endif  // TEE_COMPANIONS_PROVISIONING_VAULT_H_
