#include "ta/key_commands.h"

#include "auth/application_binding.h"
#include "keystore/key_blob.h"
#include "params/marshal.h"
#include "platform/trace.h"
#include "soter/soter_enhance.h"
#include "ta/algorithm_registry.h"
#include "ta/command_slots.h"

namespace keymaster {
namespace {

constexpr uint32_t shortest_described_blob = 2;

/// Key blob, application id, application data: what every command on an existing key sends.
struct key_request {
  heap_bytes blob;
  secret_bytes app_id, app_data;  // knowing them is what opens the key
};

TEE_Result read_key_request(std::span<const uint8_t> request, key_request& key, keymaster_error_t* error) {
  byte_reader in{request};
  std::span<const uint8_t> blob, app_id, app_data;
  if (TEE_Result r = read_field(in, blob); r != TEE_SUCCESS) return r;
  if (TEE_Result r = read_field(in, app_id); r != TEE_SUCCESS) return r;
  if (TEE_Result r = read_field(in, app_data); r != TEE_SUCCESS) return r;
  // Stops at the first that fails, with the error set.
  (void)(copy_field(blob, key.blob, error) && copy_field(app_id, key.app_id, error) &&
         copy_field(app_data, key.app_data, error));
  return TEE_SUCCESS;
}

/// Opens the blob for the application that it is bound to.
TEE_Result open_bound_key(const key_request& key, secret_bytes& key_data, parameter_set& characteristics,
                          keymaster_error_t* error) {
  if (TEE_Result r = open_key(key.blob.span(), key_data, characteristics, error);
      r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    TRACE_ERROR("Open key failed");
    return r;
  }
  if (check_app_id_and_app_data(characteristics, key.app_id.span(), key.app_data.span()) != 0) {
    TRACE_ERROR("Wrong AppId or AppData");
    *error = KM_ERROR_INVALID_KEY_BLOB;
  }
  return TEE_SUCCESS;
}

/// What the two commands on characteristics do before they part.
TEE_Result read_characteristics(std::span<const uint8_t> request, parameter_set& characteristics,
                                keymaster_error_t* error) {
  key_request key;
  if (TEE_Result r = read_key_request(request, key, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  if (key.blob.size() < shortest_described_blob) {
    TRACE_ERROR("Wrong key_blob_size %d", key.blob.size());
    *error = KM_ERROR_INVALID_KEY_BLOB;
    return TEE_SUCCESS;
  }
  secret_bytes key_data;
  return open_bound_key(key, key_data, characteristics, error);
}

TEE_Result export_public_key(std::span<const uint8_t> key_data, const keymaster_key_param_set_t& characteristics,
                             std::span<uint8_t> response, uint32_t* response_length, keymaster_error_t* error) {
  TRACE_DEBUG("normal export_key\n");
  const keymaster_key_param_t* const algorithm = key_param_set_get_unique(characteristics, KM_TAG_ALGORITHM);
  if (algorithm == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_ALGORITHM");
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  const keymaster_algorithm_descriptor* const descriptor = find_algorithm(algorithm->enumerated);
  if (descriptor == nullptr || descriptor->export_key == nullptr) {
    TRACE_ERROR("Unsupported algorithm");
    *error = KM_ERROR_UNSUPPORTED_ALGORITHM;
    return TEE_SUCCESS;
  }
  *response_length = static_cast<uint32_t>(response.size());
  const TEE_Result result = descriptor->export_key(key_data, response.data(), response_length, error);
  if (*response_length > response.size()) *error = KM_ERROR_UNKNOWN_ERROR;  // more than can have been written
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) TRACE_ERROR("Export key failed");
  return result;
}

}  // namespace

TEE_Result get_key_character_size(std::span<const uint8_t> request, keymaster_error_t* error, uint32_t* size) {
  *size = 0;
  parameter_set characteristics;
  if (TEE_Result r = read_characteristics(request, characteristics, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  uint8_t* buffer = nullptr;
  uint32_t length = 0;
  if (TEE_Result r = marshal(characteristics, false, &buffer, &length); r != TEE_SUCCESS) {
    TRACE_ERROR("Marshal failed");
    return r;
  }
  TEE_Free(buffer);
  *size = length;
  return TEE_SUCCESS;
}

TEE_Result get_key_character(std::span<const uint8_t> request, std::span<uint8_t> response, uint32_t* response_length,
                             keymaster_error_t* error) {
  parameter_set characteristics;
  if (TEE_Result r = read_characteristics(request, characteristics, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  const TEE_Result result = marshal_to_slot(characteristics, response, response_length);
  if (result != TEE_SUCCESS) TRACE_ERROR("Marshal failed");
  return result;
}

TEE_Result export_key(std::span<const uint8_t> request, std::span<uint8_t> response, uint32_t* response_length,
                      keymaster_error_t* error) {
  key_request key;
  if (TEE_Result r = read_key_request(request, key, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  secret_bytes key_data;
  parameter_set characteristics;
  if (TEE_Result r = open_bound_key(key, key_data, characteristics, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  if (!key_param_set_contains(characteristics, KM_TAG_SOTER_KEY)) {
    return export_public_key(key_data.span(), characteristics, response, response_length, error);
  }
  TRACE_DEBUG("soter export_key\n");
  *response_length = static_cast<uint32_t>(response.size());
  return soter_enhance_export_key(characteristics, key_data.span(), response.data(), response_length);
}

TEE_Result delete_key(std::span<const uint8_t> request, keymaster_error_t* error) {
  byte_reader in{request};
  std::span<const uint8_t> blob;
  if (TEE_Result r = read_field(in, blob); r != TEE_SUCCESS) return r;
  const TEE_Result result = key_store_delete_key(blob, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) TRACE_ERROR("Keystore delete key failed");
  return result;
}

TEE_Result delete_all_key(keymaster_error_t* error) {
  *error = KM_ERROR_OK;
  const TEE_Result result = key_store_delete_all_keys();
  if (result != TEE_SUCCESS) TRACE_ERROR("Keystore delete key failed");
  return result;
}

}  // namespace keymaster
