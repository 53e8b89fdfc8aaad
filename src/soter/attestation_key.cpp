#include "soter/attestation_key.h"

#include "platform/handles.h"
#include "platform/trace.h"
#include "quil/quil_client.h"

namespace keymaster {
namespace {

/// The attestation key is a 2048-bit key on every device.
constexpr uint32_t attk_bits = 2048;

using key_component = vlb_t attk_key_pair_t::*;

struct component_row {
  key_component component;
  uint16_t tag;
  uint32_t attribute;
};

/// In the order in which they are loaded, and given to the platform. A key has the first three, or all.
constexpr component_row component_rows[] = {
    {&attk_key_pair_t::n, QUIL_TAG_RSA_N, TEE_ATTR_RSA_MODULUS},
    {&attk_key_pair_t::e, QUIL_TAG_RSA_E, TEE_ATTR_RSA_PUBLIC_EXPONENT},
    {&attk_key_pair_t::d, QUIL_TAG_RSA_D, TEE_ATTR_RSA_PRIVATE_EXPONENT},
    {&attk_key_pair_t::p, QUIL_TAG_RSA_P, TEE_ATTR_RSA_PRIME1},
    {&attk_key_pair_t::q, QUIL_TAG_RSA_Q, TEE_ATTR_RSA_PRIME2},
    {&attk_key_pair_t::dp, QUIL_TAG_RSA_DP, TEE_ATTR_RSA_EXPONENT1},
    {&attk_key_pair_t::dq, QUIL_TAG_RSA_DQ, TEE_ATTR_RSA_EXPONENT2},
    {&attk_key_pair_t::qinv, QUIL_TAG_RSA_QINV, TEE_ATTR_RSA_COEFFICIENT},
};
constexpr uint32_t components_of_any_key = 3;
constexpr uint32_t components_of_crt_key = 8;

TEE_Result fill_components(attk_key_pair_t* key, const tlv_box* box) {
  for (const component_row& row : component_rows) {
    const TEE_Result result = init_vlb_with_tag(&(key->*row.component), box, row.tag);
    if (result == TEE_SUCCESS) continue;
    if (row.component != &attk_key_pair_t::p) return result;
    // Whatever became of p: the key works without it.
    TRACE_DEBUG("This rsa key pair only have n, e, d\n");
    return TEE_SUCCESS;
  }
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result init_soter_key(attk_key_pair_t* key) {
  secret_bytes buffer;
  if (!buffer.allocate(QUIL_KEY_CAPACITY)) {
    TRACE_DEBUG("No memory for serialization\n");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  uint32_t used = 0;
  TEE_Result result = retrieve_key_from_quil(buffer.data(), buffer.size(), &used);
  if (result == TEE_SUCCESS) {
    result = used <= buffer.size() ? parse_buf_fill_key(key, buffer.data(), used) : TEE_ERROR_SHORT_BUFFER;
  }
  if (result == TEE_SUCCESS) {
    TRACE_DEBUG("Init Soter key pair success\n");
  } else {
    TRACE_DEBUG("Init Soter key pair fail\n");
  }
  return result;
}

TEE_Result parse_buf_fill_key(attk_key_pair_t* key, const uint8_t* buffer, uint32_t length) {
  const tlv_box_owner box{tlv_box_parse(buffer, length)};
  if (!box) return TEE_ERROR_OUT_OF_MEMORY;
  const TEE_Result result = fill_components(key, box.get());
  if (result != TEE_SUCCESS) free_soter_key(key);
  return result;
}

TEE_Result init_vlb_with_tag(vlb_t* component, const tlv_box* box, uint16_t tag) {
  const uint8_t* value = nullptr;
  uint32_t capacity = 0;
  if (tlv_box_get_bytes_ptr(box, tag, &value, &capacity) != 0) {
    TRACE_DEBUG("Get length error for %x\n", tag);
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (!vlb_allocate(component, capacity)) {
    TRACE_DEBUG("Fail to allocate memory for %x\n", tag);
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  uint32_t length = capacity;
  const int rc = tlv_box_get_bytes(box, tag, component->buf, &length);
  if (rc != 0 || length != capacity) {
    TRACE_DEBUG("Fail to init attribute for %x, rc=%x, length(%d) capacity(%d)\n", tag, rc, length, capacity);
    vlb_free(component);
    return TEE_ERROR_SHORT_BUFFER;
  }
  return TEE_SUCCESS;
}

void free_soter_key(attk_key_pair_t* key) {
  for (const component_row& row : component_rows) vlb_free(&(key->*row.component));
}

TEE_ObjectHandle convert_key_to_object(const attk_key_pair_t* key, uint32_t* key_size) {
  *key_size = attk_bits;
  object_handle object;
  if (TEE_Result r = object.allocate(TEE_TYPE_RSA_KEYPAIR, attk_bits); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_AllocateTransientObject failed: %08x\n", r);
    return TEE_HANDLE_NULL;
  }
  const uint32_t count = key->p.length == 0 ? components_of_any_key : components_of_crt_key;
  TEE_Attribute attributes[components_of_crt_key];
  for (uint32_t i = 0; i < count; ++i) {
    const vlb_t& component = key->*component_rows[i].component;
    TEE_InitRefAttribute(&attributes[i], component_rows[i].attribute, component.buf, component.length);
  }
  if (TEE_Result r = TEE_PopulateTransientObject(object.get(), attributes, count); r != TEE_SUCCESS) {
    TRACE_ERROR("TEE_PopulateTransientObject failed: %08x\n", r);
    return TEE_HANDLE_NULL;
  }
  return object.release();
}

}  // namespace keymaster
