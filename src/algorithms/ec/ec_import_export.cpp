#include "algorithms/ec/ec_key.h"
#include "algorithms/ec/ec_key_data.h"
#include "params/key_tags.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

keymaster_error_t check_ec_key_size(uint32_t key_size) {
  if (find_ec_curve(key_size) != nullptr) return KM_ERROR_OK;
  TRACE_ERROR("Invalid EC key size %d", key_size);
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

bool write_field(byte_writer& out, std::span<const uint8_t> field) {
  const uint32_t length = static_cast<uint32_t>(field.size());
  return out.write_u32(length) && out.write_bytes(field.data(), length);
}

}  // namespace

TEE_Result ec_import_key(keymaster_key_param_set_t* params, std::span<const uint8_t> material, secret_bytes& key_data,
                         keymaster_error_t* error) {
  key_data.reset();
  *error = KM_ERROR_OK;
  byte_reader in{material};
  ec_key_fields fields;
  if (!read_ec_fields(in, fields)) return TEE_ERROR_GENERIC;

  *error = add_origin(params, KM_ORIGIN_IMPORTED);
  if (*error == KM_ERROR_OK) *error = settle_key_size(params, fields.key_size);
  if (*error == KM_ERROR_OK) *error = check_ec_key_size(fields.key_size);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  if (!key_data.copy_of(material.first(material.size() - in.remaining()))) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return TEE_SUCCESS;
}

TEE_Result ec_export_key(std::span<const uint8_t> key_data, uint8_t* output, uint32_t* output_length,
                         keymaster_error_t* error) {
  byte_reader in{key_data};
  byte_writer out{{output, *output_length}};
  ec_key_fields fields;
  *output_length = 0;
  *error = KM_ERROR_UNKNOWN_ERROR;
  if (!read_ec_public_fields(in, fields)) return TEE_SUCCESS;
  if (!out.write_u32(fields.key_size) || !write_field(out, fields.x) || !write_field(out, fields.y)) {
    TRACE_ERROR("Too short input");
    return TEE_SUCCESS;
  }
  *output_length = out.written();
  *error = KM_ERROR_OK;
  return TEE_SUCCESS;
}

}  // namespace keymaster
