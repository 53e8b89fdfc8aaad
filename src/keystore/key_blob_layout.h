// Where the fields of a key blob lie, and the cipher that seals it. For save_key and open_key alone.
#ifndef KEYMASTER_KEYSTORE_KEY_BLOB_LAYOUT_H_
#define KEYMASTER_KEYSTORE_KEY_BLOB_LAYOUT_H_

#include <cstdint>
#include <span>

#include "keystore/key_storage_key.h"
#include "platform/handles.h"

namespace keymaster {

inline constexpr uint32_t blob_iv_size = 12;
inline constexpr uint32_t blob_tag_size = 16;

inline constexpr uint32_t blob_nonce_offset = 1;
inline constexpr uint32_t blob_iv_offset = blob_nonce_offset + blob_nonce_size;
inline constexpr uint32_t blob_tag_offset = blob_iv_offset + blob_iv_size;
inline constexpr uint32_t blob_header_size = blob_tag_offset + blob_tag_size;
/// What a blob adds to the key data and the marshalled characteristics: the header and two length words.
inline constexpr uint32_t blob_overhead = blob_header_size + 2 * sizeof(uint32_t);
static_assert(blob_header_size == 93 && blob_overhead == 101);

/// start_blob_cipher derives the blob's key from `ksk` and the nonce in `header` (the blob's first 93 bytes) and
/// prepares AES-256-GCM with the IV there, in `mode`. `key` and `cipher` are empty on failure. The result is the
/// platform's.
[[nodiscard]] TEE_Result start_blob_cipher(TEE_ObjectHandle ksk, std::span<const uint8_t> header, uint32_t mode,
                                           object_handle& key, operation_handle& cipher);

}  // namespace keymaster

#endif  // KEYMASTER_KEYSTORE_KEY_BLOB_LAYOUT_H_
