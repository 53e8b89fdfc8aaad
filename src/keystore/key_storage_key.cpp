#include "keystore/key_storage_key.h"

#include <cstring>

#include "platform/key_objects.h"
#include "platform/trace.h"
#include "platform/wipe.h"

namespace keymaster {
namespace {

/// Fills the second half of the derived KSK's value. Any change makes every blob of a device without RPMB unreadable.
/// It is not zero, since the value would then equal the bare device identifier once HMAC has padded its key.
constexpr uint8_t derived_ksk_fill = 0x5A;

/// The object's identifier includes the terminating zero.
constexpr char ksk_object_id[] = "Keymaster KSK";
constexpr uint32_t ksk_object_id_length = sizeof ksk_object_id;
static_assert(ksk_object_id_length == 14);

/// The type of a blob's key: the platform's number for a generic 256-bit secret that it takes as an AES key.
constexpr uint32_t blob_key_type = 0xA0000010;

// The handles themselves, and not owners of them: nothing may run when the image is unloaded, and they live until then.
constinit TEE_ObjectHandle the_derived_ksk = TEE_HANDLE_NULL;
constinit TEE_ObjectHandle the_rpmb_ksk = TEE_HANDLE_NULL;

void keep(TEE_ObjectHandle& place, object_handle& ksk) {
  place = ksk.release();
}

void drop(TEE_ObjectHandle& place) {
  object_handle{place}.reset();
  place = TEE_HANDLE_NULL;
}

/// Draws a fresh RPMB KSK and stores its value.
TEE_Result create_rpmb_ksk(object_handle& ksk) {
  if (TEE_Result r = generate_object(TEE_TYPE_HMAC_SHA256, ksk_bits, {}, ksk); r != TEE_SUCCESS) return r;
  wiped_array<ksk_size> value;
  uint32_t length = 0;
  if (TEE_Result r = read_attribute(ksk, TEE_ATTR_SECRET_VALUE, value.bytes, &length); r != TEE_SUCCESS) return r;
  if (length != ksk_size) {
    TRACE_ERROR("Wrong key size, expected %dB, got %dB", ksk_size, length);
    return TEE_ERROR_GENERIC;
  }
  persistent_object stored;
  if (TEE_Result r = stored.create(KSK_STORAGE_ID, ksk_object_id, ksk_object_id_length, TEE_DATA_FLAG_ACCESS_READ,
                                   value.bytes, ksk_size);
      r != TEE_SUCCESS) {
    TRACE_ERROR("CreatePersistentObject failed with 0x%08x\n", r);
    return r;
  }
  return TEE_SUCCESS;
}

/// Deletes a stored KSK that can't be one. The start fails all the same: a device that lost its keys should say so
/// once.
TEE_Result delete_rpmb_ksk(persistent_object& stored) {
  TRACE_ERROR("Now, delete the key and recreate it, but all previous keymaster key will die");
  stored.reset();
  if (TEE_Result r = stored.open(KSK_STORAGE_ID, ksk_object_id, ksk_object_id_length, TEE_DATA_FLAG_ACCESS_WRITE_META);
      r != TEE_SUCCESS) {
    TRACE_ERROR("OpenPersistentObject failed with 0x%08x\n", r);
    return r;
  }
  // The handle is gone whatever the result, and the caller fails in either case.
  (void)TEE_CloseAndDeletePersistentObject1(stored.release());
  return KSK_ERROR_DELETED;
}

/// Reads the stored value. `*length` is 33 for an object that holds more than 32 bytes.
TEE_Result read_rpmb_ksk(const persistent_object& stored, std::span<uint8_t, ksk_size> value, uint32_t* length) {
  *length = 0;
  if (TEE_Result r = TEE_ReadObjectData(stored.get(), value.data(), ksk_size, length); r != TEE_SUCCESS) {
    TRACE_ERROR("ReadObjectData failed with 0x%08x\n", r);
    return r;
  }
  if (*length != ksk_size) return TEE_SUCCESS;
  wiped_array<1> surplus;
  uint32_t more = 0;
  if (TEE_Result r = TEE_ReadObjectData(stored.get(), surplus.bytes, 1, &more); r != TEE_SUCCESS) {
    TRACE_ERROR("ReadObjectData failed with 0x%08x\n", r);
    return r;
  }
  *length += more;
  return TEE_SUCCESS;
}

TEE_Result load_rpmb_ksk(persistent_object& stored, object_handle& ksk) {
  wiped_array<ksk_size> value;
  uint32_t length = 0;
  if (TEE_Result r = read_rpmb_ksk(stored, value.bytes, &length); r != TEE_SUCCESS) return r;
  if (length != ksk_size) {
    TRACE_ERROR("Wrong persistent data length, expected %dB, got %dB", ksk_size, length);
    return delete_rpmb_ksk(stored);
  }
  return make_secret_object(TEE_TYPE_HMAC_SHA256, ksk_bits, value.bytes, ksk);
}

}  // namespace

TEE_ObjectHandle derived_ksk() {
  return the_derived_ksk;
}
TEE_ObjectHandle rpmb_ksk() {
  return the_rpmb_ksk;
}

TEE_Result key_store_init() {
  // A platform that keeps the image's memory between two instances hands us the handles of the dead one.
  the_derived_ksk = TEE_HANDLE_NULL;
  the_rpmb_ksk = TEE_HANDLE_NULL;
  if (TEE_Result r = key_store_init_derived_ksk(); r != TEE_SUCCESS) {
    TRACE_ERROR("Init derived KSK failed with 0x%08x", r);
    return r;
  }
  if (judge_rpmb() == 0) {
    TRACE_INFO("no RPMB for ksk\n");
    return TEE_SUCCESS;
  }
  if (TEE_Result r = key_store_init_rpmb_ksk(); r != TEE_SUCCESS) {
    TRACE_ERROR("Init RPMB KSK failed with 0x%08x", r);
    drop(the_derived_ksk);
    return r;
  }
  return TEE_SUCCESS;
}

void key_store_release() {
  drop(the_derived_ksk);
  drop(the_rpmb_ksk);
}

TEE_Result key_store_init_derived_ksk() {
  drop(the_derived_ksk);
  TEE_UUID device_id;
  wiped_array<ksk_size> value;
  std::memset(value.bytes, derived_ksk_fill, ksk_size);
  if (TEE_Result r = TEE_GetPropertyAsUUID(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.deviceID", &device_id);
      r != TEE_SUCCESS) {
    TRACE_ERROR("GetPropertyAsUUID failed with 0x%08x\n", r);
    return r;
  }
  // As it lies in memory, and not in the big-endian order of its text form.
  static_assert(sizeof device_id == 16);
  std::memcpy(value.bytes, &device_id, sizeof device_id);
  object_handle ksk;
  if (TEE_Result r = make_secret_object(TEE_TYPE_HMAC_SHA256, ksk_bits, value.bytes, ksk); r != TEE_SUCCESS) return r;
  keep(the_derived_ksk, ksk);
  return TEE_SUCCESS;
}

int judge_rpmb() {
  uint32_t state = 0;
  const TEE_Result result = TEE_RPMB_MakeFileSystem(&state);
  if (result == TEE_SUCCESS) return 1;
  TRACE_ERROR("TEE_RPMB_MakeFileSystem return 0x%08x", result);
  return 0;
}

TEE_Result key_store_init_rpmb_ksk() {
  drop(the_rpmb_ksk);
  persistent_object stored;
  object_handle ksk;
  TEE_Result result = stored.open(KSK_STORAGE_ID, ksk_object_id, ksk_object_id_length, TEE_DATA_FLAG_ACCESS_READ);
  if (result == TEE_SUCCESS) {
    result = load_rpmb_ksk(stored, ksk);
  } else if (result == TEE_ERROR_ITEM_NOT_FOUND) {
    result = create_rpmb_ksk(ksk);
  } else {
    TRACE_ERROR("Open KSK failed with 0x%08x\n", result);
  }
  if (result == TEE_SUCCESS) keep(the_rpmb_ksk, ksk);
  return result;
}

TEE_Result TEE_DeriveKK(TEE_ObjectHandle ksk, std::span<const uint8_t, blob_nonce_size> nonce,
                        TEE_ObjectHandle* blob_key) {
  *blob_key = TEE_HANDLE_NULL;
  wiped_array<ksk_size> mac;
  uint32_t mac_length = ksk_size;
  operation_handle operation;
  if (TEE_Result r = operation.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, ksk_bits); r != TEE_SUCCESS) {
    TRACE_ERROR("AllocateOperation failed with 0x%08x\n", r);
    return r;
  }
  if (TEE_Result r = TEE_SetOperationKey(operation.get(), ksk); r != TEE_SUCCESS) {
    TRACE_ERROR("SetOperationKey failed with 0x%08x\n", r);
    return r;
  }
  TEE_MACInit(operation.get(), nullptr, 0);
  if (TEE_Result r = TEE_MACComputeFinal(operation.get(), nonce.data(), blob_nonce_size, mac.bytes, &mac_length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("MACComputeFinal failed with 0x%08x\n", r);
    return r;
  }
  operation.reset();
  if (mac_length != ksk_size) {
    TRACE_ERROR("Wrong MAC length, expected %dB, got %dB\n", ksk_size, mac_length);
    return TEE_ERROR_BAD_PARAMETERS;
  }
  object_handle key;
  if (TEE_Result r = make_secret_object(blob_key_type, ksk_bits, mac.bytes, key); r != TEE_SUCCESS) return r;
  *blob_key = key.release();
  return TEE_SUCCESS;
}

}  // namespace keymaster
