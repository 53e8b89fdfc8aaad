// EC key data: what a blob of an EC key holds beside the characteristics, and what imported material looks like.
//
//   u32 key size in bits, then X, Y and D, each a u32 length and a big-endian magnitude of that length.
//
// The exported public key is the same without D.
#ifndef KEYMASTER_ALGORITHMS_EC_EC_KEY_DATA_H_
#define KEYMASTER_ALGORITHMS_EC_EC_KEY_DATA_H_

#include <cstdint>
#include <span>

#include "params/keymaster_defs.h"
#include "platform/cursor.h"
#include "tee_internal_api.h"

namespace keymaster {

/// The fields of key data, as views of it.
struct ec_key_fields {
  uint32_t key_size = 0;  // bits
  std::span<const uint8_t> x, y, d;
};

/// A curve and what the platform calls it.
struct ec_curve {
  uint32_t key_size;
  uint32_t curve;
  uint32_t algorithm;  // ECDSA on it
};

/// find_ec_curve answers the NIST prime curve of a key size, or null.
[[nodiscard]] const ec_curve* find_ec_curve(uint32_t key_size);

/// read_ec_public_fields and read_ec_fields read key data up to Y, and all of it. False, with a trace line: a field
/// runs past the end.
[[nodiscard]] bool read_ec_public_fields(byte_reader& in, ec_key_fields& fields);
[[nodiscard]] bool read_ec_fields(byte_reader& in, ec_key_fields& fields);

/// ec_resolve_key_data makes a key-pair object from key data. `*key` is the caller's to free, null on failure;
/// `*key_size_bits` may be null. TEE_ERROR_GENERIC for key data that ends too soon; `*error` is
/// KM_ERROR_UNSUPPORTED_KEY_SIZE for a size without a curve; otherwise the platform's result.
[[nodiscard]] TEE_Result ec_resolve_key_data(std::span<const uint8_t> key_data, TEE_ObjectHandle* key,
                                             uint32_t* key_size_bits, keymaster_error_t* error);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_EC_EC_KEY_DATA_H_
