// Key blobs opened and made with libcrypto alone, from the description of their layout.
#ifndef TESTS_COMMANDS_SEALED_BLOB_H_
#define TESTS_COMMANDS_SEALED_BLOB_H_

#include <optional>

#include "tests/support/bytes.h"

namespace testing_support {

inline constexpr std::size_t blob_header = 93;
inline constexpr std::size_t blob_overhead = 101;
inline constexpr std::uint8_t sealed_by_derived_ksk = 0, sealed_by_rpmb_ksk = 1;

/// blob_key derives the key that a blob is sealed with: HMAC-SHA256 of the blob's nonce under the key storage key.
bytes blob_key(const bytes& ksk, const bytes& blob);

/// open_blob answers the plaintext, or nothing when the tag does not hold.
std::optional<bytes> open_blob(const bytes& ksk, const bytes& blob);

/// seal_blob seals any plaintext; blob_plaintext joins key data and marshalled characteristics as the TA does.
bytes seal_blob(const bytes& ksk, std::uint8_t protection, const bytes& plaintext);
bytes blob_plaintext(const bytes& key_data, const bytes& characteristics);

}  // namespace testing_support

#endif  // TESTS_COMMANDS_SEALED_BLOB_H_
