// The attestation key as the box that the Keymaster TA loads.
#ifndef TEE_COMPANIONS_PROVISIONING_KEY_BOX_H_
#define TEE_COMPANIONS_PROVISIONING_KEY_BOX_H_

#include <cstdint>
#include <span>

#include "platform/bytes.h"
#include "platform/handles.h"
#include "soter/tlv_box.h"

namespace keymaster::provisioning {

/// is_key_box tells whether the bytes are a box that a key can be loaded from: entries to the last byte, among them n,
/// e and d, and of the five that make up the other form either all or none. Whether the numbers make a key shows when
/// they are used.
[[nodiscard]] bool is_key_box(std::span<const uint8_t> box);

/// make_attestation_key makes an RSA key pair of attk_bits and public exponent 65537. The platform's result.
[[nodiscard]] TEE_Result make_attestation_key(object_handle& key);

/// make_key_box puts all components of the key into a box, in its serialized form. TEE_ERROR_OUT_OF_MEMORY;
/// TEE_ERROR_GENERIC: the platform tells a length that no component has; otherwise its result. `box` is empty then.
[[nodiscard]] TEE_Result make_key_box(const object_handle& key, tlv_box_owner& box);

/// The size of export_public_key's answer: numbers of fixed widths make it the same for every key.
inline constexpr uint32_t public_key_size = 294;

/// export_public_key writes the public key's SubjectPublicKeyInfo, in DER. TEE_ERROR_OUT_OF_MEMORY; TEE_ERROR_GENERIC:
/// it has another size than public_key_size; otherwise the platform's result. `der` is empty then.
[[nodiscard]] TEE_Result export_public_key(const object_handle& key, heap_bytes& der);

}  // namespace keymaster::provisioning

#endif  // TEE_COMPANIONS_PROVISIONING_KEY_BOX_H_
