// Digests and MACs as libcrypto computes them in one go. Digests are the public Keymaster values.
#ifndef TESTS_SUPPORT_LIBCRYPTO_DIGEST_H_
#define TESTS_SUPPORT_LIBCRYPTO_DIGEST_H_

#include <openssl/evp.h>

#include <array>

#include "src/params/keymaster_defs.h"
#include "tests/support/bytes.h"

namespace testing_support {

/// Every digest but KM_DIGEST_NONE, and those that ECDSA takes.
inline constexpr std::array<std::uint32_t, 6> every_digest = {
    keymaster::KM_DIGEST_MD5,       keymaster::KM_DIGEST_SHA1,      keymaster::KM_DIGEST_SHA_2_224,
    keymaster::KM_DIGEST_SHA_2_256, keymaster::KM_DIGEST_SHA_2_384, keymaster::KM_DIGEST_SHA_2_512};
inline constexpr std::array<std::uint32_t, 5> every_sha = {
    keymaster::KM_DIGEST_SHA1, keymaster::KM_DIGEST_SHA_2_224, keymaster::KM_DIGEST_SHA_2_256,
    keymaster::KM_DIGEST_SHA_2_384, keymaster::KM_DIGEST_SHA_2_512};

/// libcrypto_digest answers the digest; std::out_of_range for a value without one.
const EVP_MD* libcrypto_digest(std::uint32_t digest);

/// digest_size counts its bytes.
std::size_t digest_size(std::uint32_t digest);

bytes digest_of(std::uint32_t digest, std::span<const std::uint8_t> message);
bytes hmac_of(std::uint32_t digest, std::span<const std::uint8_t> key, std::span<const std::uint8_t> message);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_LIBCRYPTO_DIGEST_H_
