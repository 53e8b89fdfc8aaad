#include "soter/public_key_pem.h"

#include "platform/cursor.h"
#include "platform/handles.h"
#include "platform/trace.h"
#include "tee_internal_api_extensions.h"

namespace keymaster {
namespace {

constexpr char base64_alphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

constexpr char pem_begin[] = "-----BEGIN PUBLIC KEY-----\n";
constexpr char pem_end[] = "\n-----END PUBLIC KEY-----";
constexpr uint32_t pem_begin_length = sizeof pem_begin - 1;
static_assert(pem_begin_length == 27 && sizeof pem_end - 1 == 25);

/// Writes 1 to 3 bytes as four characters.
void encode_group(std::span<const uint8_t> group, uint8_t* characters) {
  uint32_t bits = 0;
  for (uint32_t i = 0; i < 3; ++i) bits = bits << 8 | (i < group.size() ? group[i] : 0U);
  for (uint32_t i = 0; i < 4; ++i) {
    const char character = i <= group.size() ? base64_alphabet[bits >> (18 - 6 * i) & 63] : '=';
    characters[i] = static_cast<uint8_t>(character);
  }
}

}  // namespace

TEE_Result export_rsa_public_key(TEE_ObjectHandle key_object, uint32_t key_size, uint8_t* out, uint32_t capacity,
                                 uint32_t* out_length) {
  operation_handle operation;
  if (TEE_Result r = operation.allocate(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, key_size); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_AllocateOperation failed: %08x\n", r);
    return r;
  }
  if (TEE_Result r = TEE_SetOperationKey(operation.get(), key_object); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_SetOperationKey failed: %08x\n", r);
    return r;
  }
  *out_length = capacity;
  TEE_Result result = TEE_AsymmetricExport(operation.get(), TEE_EXPORT_FORMAT_SPKI_DER, out, out_length);
  if (result == TEE_SUCCESS && *out_length > capacity) result = TEE_ERROR_GENERIC;  // more than can have been written
  if (result != TEE_SUCCESS) {
    TRACE_ERROR("TEE_AsymmetricExport failed: %08x\n", result);
    return result;
  }
  return wrap_pem_public_key(out, *out_length, out, capacity, out_length);
}

TEE_Result wrap_pem_public_key(const uint8_t* der, uint32_t der_length, uint8_t* out, uint32_t capacity,
                               uint32_t* out_length) {
  const heap_bytes text = base64_encode({der, der_length});
  if (!text) return TEE_ERROR_OUT_OF_MEMORY;
  byte_writer pem{{out, capacity}};
  const uint64_t total = uint64_t{pem_begin_length} + text.size() - 1 + sizeof pem_end;
  if (total > capacity) return TEE_ERROR_SHORT_BUFFER;
  if (!pem.write_bytes(pem_begin, pem_begin_length) || !pem.write_bytes(text.data(), text.size() - 1) ||
      !pem.write_bytes(pem_end, sizeof pem_end)) {
    return TEE_ERROR_SHORT_BUFFER;
  }
  *out_length = pem.written();
  return TEE_SUCCESS;
}

heap_bytes base64_encode(std::span<const uint8_t> data) {
  heap_bytes text;
  const uint64_t length = (uint64_t{data.size()} + 2) / 3 * 4;
  if (length >= UINT32_MAX || !text.allocate(static_cast<uint32_t>(length) + 1)) return {};
  uint8_t* characters = text.data();
  while (!data.empty()) {
    const std::size_t taken = data.size() < 3 ? data.size() : 3;
    encode_group(data.first(taken), characters);
    data = data.subspan(taken);
    characters += 4;
  }
  return text;
}

}  // namespace keymaster
