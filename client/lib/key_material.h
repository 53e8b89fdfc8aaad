// Key files in and out: what openssl writes becomes what the TA imports, and what the TA exports what openssl reads.
#ifndef KEYMASTER_CLIENT_LIB_KEY_MATERIAL_H_
#define KEYMASTER_CLIENT_LIB_KEY_MATERIAL_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "client/lib/bytes.h"
#include "client/lib/wire.h"
#include "src/params/keymaster_defs.h"

namespace keymaster::client {

/// A private key in the layout that the TA imports; all words are 32-bit little-endian, all numbers big-endian without
/// leading zero bytes:
///  - RSA: eight numbers, each behind its length: modulus, public exponent, private exponent, p, q, d mod (p - 1),
///    d mod (q - 1), q^-1 mod p;
///  - EC: the key size in bits, then x, y and the private value, each behind its length.
/// AES and HMAC keys are imported as their raw bytes and need no conversion.
struct private_key_material {
  keymaster_algorithm_t algorithm;
  std::uint32_t key_size;  ///< bits
  secret_bytes material;
};

/// read_private_key converts a private key file: PEM or DER; PKCS#8, PKCS#1 or SEC 1; encrypted PKCS#8 with
/// `passphrase`. Throws format_error when the file holds no private key, needs another passphrase, holds a key that is
/// neither RSA with two primes nor on one of the NIST prime curves, or one whose parts don't belong together.
[[nodiscard]] private_key_material read_private_key(byte_view file, std::optional<std::string_view> passphrase = {});

/// public_key_der turns what export_key gave for a key of `algorithm` into a SubjectPublicKeyInfo in DER, and
/// public_key_pem into the same as PEM. Throw format_error when it is malformed, or when the algorithm has no public
/// keys.
[[nodiscard]] bytes public_key_der(keymaster_algorithm_t algorithm, byte_view exported);
[[nodiscard]] std::string public_key_pem(keymaster_algorithm_t algorithm, byte_view exported);

/// public_half_der gives the public half of an RSA key as a SubjectPublicKeyInfo in DER. Throws format_error.
[[nodiscard]] bytes public_half_der(const private_key_material& rsa_key);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_KEY_MATERIAL_H_
