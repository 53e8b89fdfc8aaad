#include "algorithms/ec/ec_key_data.h"

#include <array>

#include "platform/key_objects.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr std::array<ec_curve, 5> curves = {{
    {192, TEE_ECC_CURVE_NIST_P192, TEE_ALG_ECDSA_P192},
    {224, TEE_ECC_CURVE_NIST_P224, TEE_ALG_ECDSA_P224},
    {256, TEE_ECC_CURVE_NIST_P256, TEE_ALG_ECDSA_P256},
    {384, TEE_ECC_CURVE_NIST_P384, TEE_ALG_ECDSA_P384},
    {521, TEE_ECC_CURVE_NIST_P521, TEE_ALG_ECDSA_P521},
}};

void set_reference(TEE_Attribute* attribute, uint32_t id, std::span<const uint8_t> value) {
  TEE_InitRefAttribute(attribute, id, value.data(), static_cast<uint32_t>(value.size()));
}

}  // namespace

const ec_curve* find_ec_curve(uint32_t key_size) {
  for (const ec_curve& curve : curves) {
    if (curve.key_size == key_size) return &curve;
  }
  return nullptr;
}

bool read_ec_public_fields(byte_reader& in, ec_key_fields& fields) {
  if (in.read_u32(fields.key_size) && in.read_block(fields.x) && in.read_block(fields.y)) return true;
  TRACE_ERROR("Too short input");
  return false;
}

bool read_ec_fields(byte_reader& in, ec_key_fields& fields) {
  if (!read_ec_public_fields(in, fields)) return false;
  if (in.read_block(fields.d)) return true;
  TRACE_ERROR("Too short input");
  return false;
}

TEE_Result ec_resolve_key_data(std::span<const uint8_t> key_data, TEE_ObjectHandle* key, uint32_t* key_size_bits,
                               keymaster_error_t* error) {
  *key = TEE_HANDLE_NULL;
  *error = KM_ERROR_OK;
  byte_reader in{key_data};
  ec_key_fields fields;
  if (!read_ec_fields(in, fields)) return TEE_ERROR_GENERIC;
  const ec_curve* const curve = find_ec_curve(fields.key_size);
  if (curve == nullptr) {
    *error = KM_ERROR_UNSUPPORTED_KEY_SIZE;
    return TEE_SUCCESS;
  }
  TEE_Attribute attributes[4];
  set_reference(&attributes[0], TEE_ATTR_ECC_PUBLIC_VALUE_X, fields.x);
  set_reference(&attributes[1], TEE_ATTR_ECC_PUBLIC_VALUE_Y, fields.y);
  set_reference(&attributes[2], TEE_ATTR_ECC_PRIVATE_VALUE, fields.d);
  TEE_InitValueAttribute(&attributes[3], TEE_ATTR_ECC_CURVE, curve->curve, 0);

  object_handle object;
  if (TEE_Result r = populate_object(TEE_TYPE_ECDSA_KEYPAIR, fields.key_size, attributes, object); r != TEE_SUCCESS) {
    return r;
  }
  *key = object.release();
  if (key_size_bits != nullptr) *key_size_bits = fields.key_size;
  return TEE_SUCCESS;
}

}  // namespace keymaster
