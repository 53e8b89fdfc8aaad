#include "keystore/key_blob.h"

#include <cstring>
#include "keystore/key_blob_layout.h"
#include "params/dump.h"
#include "params/marshal.h"
#include "platform/cursor.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

/// Finds the KSK that a blob was sealed under. Null with TEE_SUCCESS and `*error` set: the protection type is unknown.
TEE_Result find_ksk(uint8_t protection, TEE_ObjectHandle* ksk, keymaster_error_t* error) {
  *ksk = TEE_HANDLE_NULL;
  switch (protection) {
    case KEY_PROTECTION_DERIVED:
      *ksk = derived_ksk();
      return TEE_SUCCESS;
    case KEY_PROTECTION_RPMB:
      *ksk = rpmb_ksk();
      if (*ksk != TEE_HANDLE_NULL) return TEE_SUCCESS;
      TRACE_ERROR("RPMB KSK died, fail to open key");
      return KSK_ERROR_RPMB_GONE;
    default:
      TRACE_ERROR("Unknown key protection");
      *error = KM_ERROR_INVALID_KEY_BLOB;
      return TEE_SUCCESS;
  }
}

/// Decrypts the blob's ciphertext into a buffer of its size and checks the tag. A failure that is not the platform's is
/// left in `*error`, with TEE_SUCCESS.
TEE_Result decrypt(const operation_handle& cipher, std::span<const uint8_t> blob, secret_bytes& plaintext,
                   keymaster_error_t* error) {
  const std::span<const uint8_t> ciphertext = blob.subspan(blob_header_size);
  const uint32_t size = static_cast<uint32_t>(ciphertext.size());
  if (!plaintext.allocate(size)) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  uint32_t updated = size;
  if (TEE_Result r = TEE_AEUpdate(cipher.get(), ciphertext.data(), size, plaintext.data(), &updated);
      r != TEE_SUCCESS) {
    TRACE_ERROR("AEUpdate failed with 0x%08x\n", r);
    return r;
  }
  // A platform that claims more than it was given room for is caught below, once it has judged the tag.
  const uint32_t place = updated < size ? updated : size;
  uint32_t finished = size - place;
  wiped_array<blob_tag_size> tag;
  std::memcpy(tag.bytes, blob.data() + blob_tag_offset, blob_tag_size);
  if (TEE_Result r =
          TEE_AEDecryptFinal(cipher.get(), nullptr, 0, plaintext.data() + place, &finished, tag.bytes, blob_tag_size);
      r != TEE_SUCCESS) {
    TRACE_ERROR("AEDecryptFinal failed with 0x%08x\n", r);
    return r;
  }
  if (uint64_t{updated} + finished != size) {
    TRACE_ERROR("Too short output of AES, expect %dB, got %dB", size, updated + finished);
    *error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

/// Takes the key data and the characteristics out of the plaintext. Failures as of decrypt.
TEE_Result parse_plaintext(std::span<const uint8_t> plaintext, secret_bytes& key_data, parameter_set& characteristics,
                           keymaster_error_t* error) {
  byte_reader in{plaintext};
  uint32_t key_data_length = 0;
  if (!in.read_u32(key_data_length)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  // Allocated before the length is compared with what there is: a huge length is a want of memory.
  if (!key_data.allocate(key_data_length)) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  std::span<const uint8_t> marshalled;
  if (!in.copy_to(key_data.data(), key_data_length) || !in.read_block(marshalled)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  if (unmarshal(marshalled, &characteristics) != TEE_SUCCESS) {
    TRACE_ERROR("Unmarshal failed");
    *error = KM_ERROR_INVALID_ARGUMENT;
  }
  return TEE_SUCCESS;
}

/// open_key with an error variable of its own, so that "no error" can be told from "untouched".
TEE_Result open_sealed(std::span<const uint8_t> blob, secret_bytes& key_data, parameter_set& characteristics,
                       keymaster_error_t* error) {
  if (blob.size() <= blob_header_size) {
    TRACE_ERROR("Too short key blob");
    *error = KM_ERROR_INVALID_KEY_BLOB;
    return TEE_SUCCESS;
  }
  TEE_ObjectHandle ksk = TEE_HANDLE_NULL;
  if (TEE_Result r = find_ksk(blob[0], &ksk, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;

  object_handle key;
  operation_handle cipher;
  if (TEE_Result r = start_blob_cipher(ksk, blob.first(blob_header_size), TEE_MODE_DECRYPT, key, cipher);
      r != TEE_SUCCESS) {
    return r;
  }
  secret_bytes plaintext;
  if (TEE_Result r = decrypt(cipher, blob, plaintext, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  return parse_plaintext(plaintext.span(), key_data, characteristics, error);
}

}  // namespace

TEE_Result open_key(std::span<const uint8_t> blob, secret_bytes& key_data, parameter_set& characteristics,
                    keymaster_error_t* error) {
  key_data.reset();
  characteristics.reset();
  keymaster_error_t found = KM_ERROR_OK;
  const TEE_Result result = open_sealed(blob, key_data, characteristics, &found);
  if (result != TEE_SUCCESS || found != KM_ERROR_OK) {
    key_data.reset();
    characteristics.reset();
    if (found != KM_ERROR_OK) *error = found;
    return result;
  }
  KEYMASTER_DUMP_KEY_PARAM_SET(characteristics);
  *error = KM_ERROR_OK;
  return TEE_SUCCESS;
}

}  // namespace keymaster
