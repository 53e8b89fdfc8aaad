// RSA key data: what a blob of an RSA key holds beside the characteristics.
//
//   u32 key size in bits, then eight components, each a u32 length and a big-endian magnitude of that length:
//   n, e, d, p, q, d mod (p-1), d mod (q-1), q^-1 mod p.
//
// Import material is the same without the key size.
#ifndef KEYMASTER_ALGORITHMS_RSA_RSA_KEY_DATA_H_
#define KEYMASTER_ALGORITHMS_RSA_RSA_KEY_DATA_H_

#include <array>
#include <cstdint>
#include <span>

#include "params/keymaster_defs.h"
#include "platform/cursor.h"
#include "tee_internal_api.h"

namespace keymaster {

inline constexpr uint32_t rsa_component_count = 8;

/// The attributes of the components, in the order of the key data.
inline constexpr std::array<uint32_t, rsa_component_count> rsa_component_attributes = {
    TEE_ATTR_RSA_MODULUS, TEE_ATTR_RSA_PUBLIC_EXPONENT, TEE_ATTR_RSA_PRIVATE_EXPONENT, TEE_ATTR_RSA_PRIME1,
    TEE_ATTR_RSA_PRIME2,  TEE_ATTR_RSA_EXPONENT1,       TEE_ATTR_RSA_EXPONENT2,        TEE_ATTR_RSA_COEFFICIENT,
};

/// Positions of two of them.
inline constexpr uint32_t rsa_modulus = 0;
inline constexpr uint32_t rsa_public_exponent = 1;

using rsa_components = std::array<std::span<const uint8_t>, rsa_component_count>;

/// read_rsa_components reads the eight components as views. False, with a trace line: one runs past the end.
[[nodiscard]] bool read_rsa_components(byte_reader& in, rsa_components& components);

/// rsa_resolve_key_data makes a key-pair object from key data. `*key` is the caller's to free; `*key_size_bits` (may be
/// null) receives the size that the key data states.
/// TEE_ERROR_GENERIC for key data that ends too soon; otherwise the platform's result. `*key` is null on failure.
[[nodiscard]] TEE_Result rsa_resolve_key_data(std::span<const uint8_t> key_data, TEE_ObjectHandle* key,
                                              uint32_t* key_size_bits, keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_RSA_RSA_KEY_DATA_H_
