#include "keystore/key_blob.h"

#include <cstring>
#include "keystore/key_blob_layout.h"
#include "params/marshal.h"
#include "platform/cursor.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

/// Marshals the characteristics, hidden ones included, into a buffer of their size.
TEE_Result marshal_all(const keymaster_key_param_set_t& characteristics, secret_bytes& marshalled) {
  const uint32_t size = marshal_size(characteristics, true);
  uint8_t* buffer = nullptr;
  uint32_t length = 0;
  if (TEE_Result r = marshal(characteristics, true, &buffer, &length); r != TEE_SUCCESS) return r;
  marshalled.adopt(buffer, size);
  return TEE_SUCCESS;
}

TEE_Result refuse_total(uint32_t expected, uint32_t actual) {
  TRACE_ERROR("Unmatched total size, expected: %d actual: %d\n", expected, actual);
  return TEE_ERROR_GENERIC;
}

/// Moves `out` on by the `length` bytes that the platform says it wrote. More than there was room for is a wrong total,
/// found early.
TEE_Result take_written(byte_writer& out, uint32_t length) {
  std::span<uint8_t> written;
  if (out.reserve(length, written)) return TEE_SUCCESS;
  const uint32_t before = blob_header_size + out.written();
  return refuse_total(before + out.remaining(), before + length);
}

/// Encrypts one piece of the plaintext to the end of `out`.
TEE_Result encrypt_piece(const operation_handle& cipher, std::span<const uint8_t> piece, byte_writer& out) {
  uint32_t length = out.remaining();
  if (TEE_Result r =
          TEE_AEUpdate(cipher.get(), piece.data(), static_cast<uint32_t>(piece.size()), out.rest().data(), &length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("AEUpdate failed with 0x%08x\n", r);
    return r;
  }
  return take_written(out, length);
}

TEE_Result finish_encryption(const operation_handle& cipher, std::span<uint8_t> tag, byte_writer& out) {
  uint32_t length = out.remaining();
  uint32_t tag_length = static_cast<uint32_t>(tag.size());
  if (TEE_Result r = TEE_AEEncryptFinal(cipher.get(), nullptr, 0, out.rest().data(), &length, tag.data(), &tag_length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("AEEncryptFinal failed with 0x%08x\n", r);
    return r;
  }
  if (tag_length != blob_tag_size) {
    // The second number is the ciphertext's byte count and not the tag's: the line stays comparable with older logs.
    TRACE_ERROR("Wrong tag size, expect %dB, got %dB", blob_tag_size, length);
    return TEE_ERROR_GENERIC;
  }
  return take_written(out, length);
}

/// Seals into `sealed`, which has exactly the size of the blob.
TEE_Result seal(std::span<const uint8_t> key_data, std::span<const uint8_t> marshalled, std::span<uint8_t> sealed) {
  TEE_GenerateRandom(sealed.data() + blob_nonce_offset, blob_nonce_size);
  TEE_GenerateRandom(sealed.data() + blob_iv_offset, blob_iv_size);
  const bool with_rpmb = rpmb_ksk() != TEE_HANDLE_NULL;
  sealed[0] = with_rpmb ? KEY_PROTECTION_RPMB : KEY_PROTECTION_DERIVED;

  object_handle key;
  operation_handle cipher;
  if (TEE_Result r = start_blob_cipher(with_rpmb ? rpmb_ksk() : derived_ksk(), sealed.first(blob_header_size),
                                       TEE_MODE_ENCRYPT, key, cipher);
      r != TEE_SUCCESS) {
    return r;
  }
  byte_writer out{sealed.subspan(blob_header_size)};
  for (const std::span<const uint8_t> field : {key_data, marshalled}) {
    const uint32_t length = static_cast<uint32_t>(field.size());
    const auto* length_bytes = reinterpret_cast<const uint8_t*>(&length);
    if (TEE_Result r = encrypt_piece(cipher, {length_bytes, sizeof length}, out); r != TEE_SUCCESS) return r;
    if (TEE_Result r = encrypt_piece(cipher, field, out); r != TEE_SUCCESS) return r;
  }
  if (TEE_Result r = finish_encryption(cipher, sealed.subspan(blob_tag_offset, blob_tag_size), out); r != TEE_SUCCESS) {
    return r;
  }
  const uint32_t expected = static_cast<uint32_t>(sealed.size());
  const uint32_t total = blob_header_size + out.written();
  return total == expected ? TEE_SUCCESS : refuse_total(expected, total);
}

}  // namespace

TEE_Result save_key(std::span<const uint8_t> key_data, const keymaster_key_param_set_t& characteristics,
                    std::span<uint8_t> blob, uint32_t* blob_length) {
  *blob_length = 0;
  secret_bytes marshalled;
  if (TEE_Result r = marshal_all(characteristics, marshalled); r != TEE_SUCCESS) {
    TRACE_ERROR("Marshal failed");
    return r;
  }
  const uint64_t total = uint64_t{blob_overhead} + key_data.size() + marshalled.size();
  if (total > blob.size()) {
    TRACE_ERROR("Too short key blob");
    return TEE_ERROR_SHORT_BUFFER;
  }
  heap_bytes sealed;
  if (!sealed.allocate(static_cast<uint32_t>(total))) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  if (TEE_Result r = seal(key_data, marshalled.span(), sealed.span()); r != TEE_SUCCESS) return r;
  std::memcpy(blob.data(), sealed.data(), sealed.size());
  *blob_length = sealed.size();
  return TEE_SUCCESS;
}

}  // namespace keymaster
