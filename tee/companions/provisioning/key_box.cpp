#include "tee/companions/provisioning/key_box.h"

#include "platform/key_objects.h"
#include "platform/trace.h"
#include "tee/companions/provisioning/provisioning_protocol.h"
#include "tee_internal_api_extensions.h"

namespace keymaster::provisioning {
namespace {

struct component_row {
  uint16_t tag;
  uint32_t attribute;
};
constexpr component_row component_rows[] = {
    {QUIL_TAG_RSA_N, TEE_ATTR_RSA_MODULUS},          {QUIL_TAG_RSA_E, TEE_ATTR_RSA_PUBLIC_EXPONENT},
    {QUIL_TAG_RSA_D, TEE_ATTR_RSA_PRIVATE_EXPONENT}, {QUIL_TAG_RSA_P, TEE_ATTR_RSA_PRIME1},
    {QUIL_TAG_RSA_Q, TEE_ATTR_RSA_PRIME2},           {QUIL_TAG_RSA_DP, TEE_ATTR_RSA_EXPONENT1},
    {QUIL_TAG_RSA_DQ, TEE_ATTR_RSA_EXPONENT2},       {QUIL_TAG_RSA_QINV, TEE_ATTR_RSA_COEFFICIENT},
};

constexpr uint32_t attk_bytes = attk_bits / 8;

/// A set of the tags of components, a bit each.
constexpr uint32_t tag_bit(uint16_t tag) {
  return tag >= QUIL_TAG_RSA_N && tag <= QUIL_TAG_RSA_QINV ? 1U << tag : 0;
}
constexpr uint32_t tags_of_any_key = tag_bit(QUIL_TAG_RSA_N) | tag_bit(QUIL_TAG_RSA_E) | tag_bit(QUIL_TAG_RSA_D);
constexpr uint32_t tags_of_crt_key = tags_of_any_key | tag_bit(QUIL_TAG_RSA_P) | tag_bit(QUIL_TAG_RSA_Q) |
                                     tag_bit(QUIL_TAG_RSA_DP) | tag_bit(QUIL_TAG_RSA_DQ) | tag_bit(QUIL_TAG_RSA_QINV);
static_assert(tags_of_any_key == 0x000E0000 && tags_of_crt_key == 0x01FE0000);

TEE_Result put_component(const object_handle& key, const component_row& row, tlv_box* box) {
  secret_bytes value;
  if (!value.allocate(attk_bytes)) return TEE_ERROR_OUT_OF_MEMORY;
  uint32_t length = 0;
  if (TEE_Result r = read_attribute(key, row.attribute, value.span(), &length); r != TEE_SUCCESS) return r;
  if (length > value.size()) return TEE_ERROR_GENERIC;
  return tlv_box_put_bytes(box, row.tag, value.data(), length) == 0 ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
}

TEE_Result put_components(const object_handle& key, tlv_box* box) {
  for (const component_row& row : component_rows) {
    if (TEE_Result r = put_component(key, row, box); r != TEE_SUCCESS) return r;
  }
  return tlv_box_serialize(box) == 0 ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
}

}  // namespace

// Reads the entries rather than make a box of them: what the heap can't hold is not the fault of the bytes.
bool is_key_box(std::span<const uint8_t> box) {
  uint32_t tags = 0;
  byte_reader in{box};
  while (in.remaining() != 0) {
    uint16_t tag = 0;
    std::span<const uint8_t> value;
    if (!tlv_read_entry(in, tag, value)) return false;
    tags |= tag_bit(tag);
  }
  return tags == tags_of_any_key || tags == tags_of_crt_key;
}

TEE_Result make_attestation_key(object_handle& key) {
  constexpr uint8_t exponent[] = {0x01, 0x00, 0x01};
  TEE_Attribute parameter;
  TEE_InitRefAttribute(&parameter, TEE_ATTR_RSA_PUBLIC_EXPONENT, exponent, sizeof exponent);
  return generate_object(TEE_TYPE_RSA_KEYPAIR, attk_bits, {&parameter, 1}, key);
}

TEE_Result make_key_box(const object_handle& key, tlv_box_owner& box) {
  box.reset(tlv_box_create());
  const TEE_Result result = box ? put_components(key, box.get()) : TEE_ERROR_OUT_OF_MEMORY;
  if (result != TEE_SUCCESS) {
    TRACE_ERROR("Make the box of the key failed with 0x%08x\n", result);
    box.reset();
  }
  return result;
}

TEE_Result export_public_key(const object_handle& key, heap_bytes& der) {
  operation_handle operation;
  if (TEE_Result r = make_operation(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, attk_bits, key, operation); r != TEE_SUCCESS) {
    return r;
  }
  if (!der.allocate(public_key_size)) {
    TRACE_ERROR("Out of memory\n");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  uint32_t length = der.size();
  TEE_Result result = TEE_AsymmetricExport(operation.get(), TEE_EXPORT_FORMAT_SPKI_DER, der.data(), &length);
  if (result == TEE_SUCCESS && length != public_key_size) result = TEE_ERROR_GENERIC;
  if (result != TEE_SUCCESS) {
    TRACE_ERROR("AsymmetricExport failed with 0x%08x\n", result);
    der.reset();
  }
  return result;
}

}  // namespace keymaster::provisioning
