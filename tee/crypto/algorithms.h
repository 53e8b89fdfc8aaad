// The primitives of libcrypto that the platform uses, each fetched once for the process.
#ifndef TEE_CRYPTO_ALGORITHMS_H_
#define TEE_CRYPTO_ALGORITHMS_H_

#include <cstdint>

#include "tee/crypto/libcrypto.h"

namespace hosted_tee {

/// In the order of the API's numbers (the last digit of TEE_ALG_MD5 … TEE_ALG_SHA512).
enum class digest_kind : std::uint8_t { none, md5, sha1, sha224, sha256, sha384, sha512 };
enum class block_mode : std::uint8_t { ecb, cbc, ctr, gcm };

[[nodiscard]] std::uint32_t digest_bytes(digest_kind digest);  ///< 0 for none
[[nodiscard]] const char* digest_name(digest_kind digest);     ///< libcrypto's name; null for none

/// The fetched algorithms live as long as the process. `digest` isn't none; `key_bytes` is 16, 24 or 32.
[[nodiscard]] const EVP_MD* fetched_digest(digest_kind digest);
[[nodiscard]] const EVP_CIPHER* fetched_aes(block_mode mode, std::size_t key_bytes);
[[nodiscard]] EVP_MAC* fetched_hmac();

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_ALGORITHMS_H_
