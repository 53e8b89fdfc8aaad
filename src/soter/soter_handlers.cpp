#include "soter/soter_handlers.h"

#include "params/keymaster_defs.h"
#include "params/keymaster_protocol.h"
#include "platform/byte_order.h"
#include "platform/cursor.h"
#include "platform/handles.h"
#include "platform/trace.h"
#include "quil/quil_client.h"
#include "soter/finger_id.h"
#include "soter/public_key_pem.h"
#include "soter/soter_init.h"

namespace keymaster {
namespace {

constexpr int attk_attempts = 3;

/// Slot 0 tells the status; the command itself succeeds.
TEE_Result answer(TEE_Param* slot0, int32_t status) {
  slot0->value.a = static_cast<uint32_t>(status);
  return TEE_SUCCESS;
}

/// Loads the attestation key beside the resources, and drops it again.
TEE_Result try_attk() {
  attk_key_pair_t key = {};
  const TEE_Result result = init_soter_key(&key);
  free_soter_key(&key);
  return result;
}

int32_t export_attk(TEE_Param* slot2) {
  if (slot2->memref.buffer == nullptr) return KM_ERROR_INVALID_ARGUMENT;
  if (soter_ensure_ready() != TEE_SUCCESS) return SOTER_STATUS_NO_ATTK;
  uint32_t key_size = 0;
  const object_handle key{convert_key_to_object(&attk_key_pair, &key_size)};
  if (!key) return KM_ERROR_UNKNOWN_ERROR;
  uint32_t length = 0;
  const TEE_Result result = export_rsa_public_key(key.get(), key_size, static_cast<uint8_t*>(slot2->memref.buffer),
                                                  slot2->memref.size, &length);
  if (result != TEE_SUCCESS) return KM_ERROR_UNKNOWN_ERROR;
  slot2->memref.size = length;
  return SOTER_STATUS_OK;
}

/// Copies the fingerprint TA's message once: the sender may go on writing there.
bool copy_message(const void* buffer, uint8_t (&message)[SOTER_FID_MESSAGE_SIZE]) {
  if (buffer == nullptr) return false;
  byte_reader in{{static_cast<const uint8_t*>(buffer), sizeof message}};
  return in.copy_to(message, sizeof message);
}

}  // namespace

// Nothing is generated: the attestation key is provisioned, and this is the client's way to have it loaded.
TEE_Result soter_handle_generate_attk_key_pair(uint32_t /*argument*/, TEE_Param* slot0) {
  TRACE_INFO("this function should not be called in anytime but in meta mode\n");
  if (soter_ensure_ready() != TEE_SUCCESS) {
    TRACE_ERROR("attk_key_pair is not produced\n");
    return answer(slot0, KM_ERROR_UNKNOWN_ERROR);
  }
  return answer(slot0, SOTER_STATUS_OK);
}

TEE_Result soter_handle_verify_attk_key_pair(TEE_Param* slot0) {
  TEE_Result result = TEE_ERROR_OUT_OF_MEMORY;
  for (int i = 0; i < attk_attempts && result == TEE_ERROR_OUT_OF_MEMORY; ++i) result = try_attk();
  if (result == TEE_SUCCESS) return answer(slot0, SOTER_STATUS_OK);
  return answer(slot0, result == TEE_ERROR_ITEM_NOT_FOUND ? SOTER_STATUS_NO_ATTK : SOTER_STATUS_UNREADABLE_ATTK);
}

TEE_Result soter_handle_export_attk_public_key(TEE_Param* slot2, TEE_Param* slot0) {
  const int32_t status = export_attk(slot2);
  // What a failure leaves in the buffer is no PEM, and must not be taken for one.
  if (status != SOTER_STATUS_OK) slot2->memref.size = 0;
  return answer(slot0, status);
}

TEE_Result soter_handle_get_device_id(TEE_Param* slot2, TEE_Param* slot0) {
  uint32_t length = slot2->memref.size;
  TEE_Result result = retrieve_property_from_quil(&QUIL_PROPERTY_DEVICE_ID, slot2->memref.buffer, &length);
  if (result == TEE_SUCCESS && length > slot2->memref.size) result = TEE_ERROR_SHORT_BUFFER;
  if (result == TEE_ERROR_SHORT_BUFFER) return answer(slot0, KM_ERROR_INSUFFICIENT_BUFFER_SPACE);
  if (result != TEE_SUCCESS) {
    TRACE_ERROR("retrieve_device_id_from_quil fail, 0x%x\n", result);
    return answer(slot0, KM_ERROR_UNKNOWN_ERROR);
  }
  slot2->memref.size = length;
  return answer(slot0, SOTER_STATUS_OK);
}

TEE_Result soter_handle_setFid(const void* buffer, uint32_t length) {
  TRACE_DEBUG("soter handle finger print ta notify");
  if (TEE_Result r = is_from_fp_ta(); r != TEE_SUCCESS) {
    TRACE_ERROR("soter deny finger print ta");
    return r;
  }
  uint8_t message[SOTER_FID_MESSAGE_SIZE];
  if (length != sizeof message || !copy_message(buffer, message)) {
    TRACE_ERROR("finger print ta input argument error");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  const uint32_t version = load_u32(message);
  if (version != SOTER_FID_MESSAGE_VERSION) {
    TRACE_ERROR("finger print ta input argument version mismatch expected %u actual %u\n", SOTER_FID_MESSAGE_VERSION,
                version);
    return TEE_ERROR_BAD_FORMAT;
  }
  soter_set_fid(load_u32(message + 4), load_u64(message + 8));
  TRACE_DEBUG("soter handle finger print ta notify success");
  return TEE_SUCCESS;
}

}  // namespace keymaster
