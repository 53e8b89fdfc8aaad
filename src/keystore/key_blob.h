// The key blob: the only form in which a key leaves the TA.
//
//   offset  size          field
//        0  1             protection type: which KSK the blob's key is derived from
//        1  64            derivation nonce
//       65  12            GCM IV
//       77  16            GCM tag
//       93  4+K+4+M       AES-256-GCM ciphertext of: K, key data, M, marshalled characteristics (hidden ones included)
//
// Nothing is authenticated beside the ciphertext: another protection type or nonce gives another key, and the IV is an
// input of GCM, so that altering any of them fails the tag.
#ifndef KEYMASTER_KEYSTORE_KEY_BLOB_H_
#define KEYMASTER_KEYSTORE_KEY_BLOB_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

inline constexpr uint8_t KEY_PROTECTION_DERIVED = 0;  ///< sealed under the derived KSK
inline constexpr uint8_t KEY_PROTECTION_RPMB = 1;     ///< sealed under the RPMB KSK

/// save_key seals `key_data` and `characteristics` (both borrowed) into `blob`, under the RPMB KSK where it is loaded.
/// `*blob_length` is the blob's size, 0 on failure. The blob is put together on the TA's heap and copied out last,
/// since `blob` may be memory that the normal world reads and writes meanwhile. TEE_ERROR_SHORT_BUFFER when `blob` is
/// smaller than 101 + K + M bytes; TEE_ERROR_OUT_OF_MEMORY; TEE_ERROR_GENERIC when the platform's cipher answers other
/// sizes than AES-GCM has; otherwise the platform's result.
[[nodiscard]] TEE_Result save_key(std::span<const uint8_t> key_data, const keymaster_key_param_set_t& characteristics,
                                  std::span<uint8_t> blob, uint32_t* blob_length);

/// open_key opens a sealed blob and hands out the key data and the characteristics inside. `blob` is read several times
/// and must not be memory that the normal world can change.
/// A malformed blob is the client's fault: the result is TEE_SUCCESS and `*error` tells (KM_ERROR_INVALID_KEY_BLOB: 93
/// bytes or fewer, or of an unknown protection type; KM_ERROR_MEMORY_ALLOCATION_FAILED; KM_ERROR_UNKNOWN_ERROR: the
/// cipher gave back fewer bytes than it took; KM_ERROR_INVALID_ARGUMENT: the characteristics don't unmarshal). A blob
/// whose tag does not verify is the platform's finding: its result is returned and `*error` stays as it was, as with
/// every platform failure; KSK_ERROR_RPMB_GONE when the blob needs the RPMB KSK and there is none; TEE_ERROR_GENERIC
/// when the inner lengths don't fit. `*error` is KM_ERROR_OK on success only. On every failure `key_data` and
/// `characteristics` are empty.
[[nodiscard]] TEE_Result open_key(std::span<const uint8_t> blob, secret_bytes& key_data, parameter_set& characteristics,
                                  keymaster_error_t* error);

/// key_store_delete_key refuses a blob shorter than 2 bytes (KM_ERROR_INVALID_KEY_BLOB) and otherwise has nothing to
/// do: a blob lives with the client alone. The result is always TEE_SUCCESS.
[[nodiscard]] TEE_Result key_store_delete_key(std::span<const uint8_t> blob, keymaster_error_t* error);

/// key_store_delete_all_keys has nothing to do and always succeeds.
[[nodiscard]] TEE_Result key_store_delete_all_keys();

}  // namespace keymaster

#endif  // KEYMASTER_KEYSTORE_KEY_BLOB_H_
