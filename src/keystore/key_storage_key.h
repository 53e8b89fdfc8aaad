// The key storage keys (KSK), under which every key blob is sealed.
//
// The derived KSK is rebuilt from the device identifier at every start and always exists. The RPMB KSK is random, drawn
// once and kept as a persistent object in the RPMB-backed storage; it exists only where that storage can be used. Both
// are set when the instance is created, live as long as it does, and are only read afterwards.
#ifndef KEYMASTER_KEYSTORE_KEY_STORAGE_KEY_H_
#define KEYMASTER_KEYSTORE_KEY_STORAGE_KEY_H_

#include <cstdint>
#include <span>

#include "platform/handles.h"
#include "tee_internal_api_extensions.h"

namespace keymaster {

/// The stored RPMB KSK was malformed and has just been deleted; the next start draws a fresh one.
inline constexpr TEE_Result KSK_ERROR_DELETED = 0xF0100001;
/// A blob needs the RPMB KSK and none is loaded.
inline constexpr TEE_Result KSK_ERROR_RPMB_GONE = 0xF0100003;

/// Where the RPMB KSK is kept.
inline constexpr uint32_t KSK_STORAGE_ID = TEE_STORAGE_RPMB;

inline constexpr uint32_t ksk_size = 32;  // bytes of a KSK, and of the key of a blob
inline constexpr uint32_t ksk_bits = ksk_size * 8;
inline constexpr uint32_t blob_nonce_size = 64;  // bytes that a blob's key is derived from

/// key_store_init makes the KSKs: the derived one always, the RPMB one where judge_rpmb finds the storage usable.
/// Called once, when the instance is created. A failure is fatal to the instance; its result is the platform's, or
/// KSK_ERROR_DELETED, and no KSK is left behind.
[[nodiscard]] TEE_Result key_store_init();

/// key_store_release frees the KSKs. Only a start that fails afterwards needs it: otherwise they live as long as the
/// instance.
void key_store_release();

/// key_store_init_derived_ksk builds the derived KSK from "gpd.tee.deviceID".
[[nodiscard]] TEE_Result key_store_init_derived_ksk();

/// judge_rpmb answers 1 when the RPMB storage can be used, preparing it on the way, and 0 when it can't.
[[nodiscard]] int judge_rpmb();

/// key_store_init_rpmb_ksk loads the RPMB KSK, or draws and stores it when there is none. An object of another size
/// than 32 bytes is deleted and KSK_ERROR_DELETED returned: all blobs sealed under it are lost.
[[nodiscard]] TEE_Result key_store_init_rpmb_ksk();

/// derived_ksk and rpmb_ksk answer the KSKs; null: absent.
[[nodiscard]] TEE_ObjectHandle derived_ksk();
[[nodiscard]] TEE_ObjectHandle rpmb_ksk();

/// TEE_DeriveKK derives the key of one blob: HMAC-SHA256 of the nonce under `ksk`, as a 256-bit key object that AES-GCM
/// takes. `*blob_key` is the caller's to free, and null on failure. TEE_ERROR_BAD_PARAMETERS when the platform's MAC is
/// not 32 bytes long; other results are the platform's. Despite the prefix it is no function of the platform.
[[nodiscard]] TEE_Result TEE_DeriveKK(TEE_ObjectHandle ksk, std::span<const uint8_t, blob_nonce_size> nonce,
                                      TEE_ObjectHandle* blob_key);

}  // namespace keymaster

#endif  // KEYMASTER_KEYSTORE_KEY_STORAGE_KEY_H_
