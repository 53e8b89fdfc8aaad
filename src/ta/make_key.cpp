#include "keystore/key_blob.h"

#include <cstring>
#include "params/dump.h"
#include "params/marshal.h"
#include "platform/trace.h"
#include "ta/algorithm_registry.h"
#include "ta/command_slots.h"
#include "ta/key_commands.h"

namespace keymaster {
namespace {

/// The first half of what generate_key and import_key have in common. TEE_ERROR_BAD_PARAMETERS is the answer here, also
/// when it was memory that was short.
TEE_Result unmarshal_key_params(std::span<const uint8_t> marshalled, parameter_set& params) {
  if (unmarshal(marshalled, &params) != TEE_SUCCESS) {
    TRACE_ERROR("Unmarshal failed");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  KEYMASTER_DUMP_KEY_PARAM_SET(params);
  return TEE_SUCCESS;
}

/// Where a blob may be used is said at most once. The key exists already when this is looked at.
keymaster_error_t check_blob_usage(const keymaster_key_param_set_t& params) {
  if (key_param_set_at_most_one(params, KM_TAG_BLOB_USAGE_REQUIREMENTS)) return KM_ERROR_OK;
  TRACE_ERROR("Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified");
  return KM_ERROR_INVALID_TAG;
}

TEE_Result save_to(std::span<const uint8_t> key_data, const keymaster_key_param_set_t& params, std::span<uint8_t> place,
                   uint32_t* length) {
  const TEE_Result result = save_key(key_data, params, place, length);
  if (result != TEE_SUCCESS) TRACE_ERROR("Can't save key to TEE storage");
  return result;
}

TEE_Result generate(std::span<const uint8_t> request, std::span<uint8_t> response, uint32_t* response_length,
                    keymaster_error_t* error) {
  parameter_set params;
  if (TEE_Result r = unmarshal_key_params(request, params); r != TEE_SUCCESS) return r;

  const keymaster_key_param_t* const algorithm = key_param_set_get_unique(params, KM_TAG_ALGORITHM);
  if (algorithm == nullptr) {
    TRACE_ERROR("No KM_TAG_ALGORITHM or many KM_TAG_ALGORITHM");
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  const keymaster_algorithm_descriptor* const descriptor = find_algorithm(algorithm->enumerated);
  if (descriptor == nullptr || descriptor->generate_key == nullptr) {
    *error = KM_ERROR_UNSUPPORTED_ALGORITHM;
    return TEE_SUCCESS;
  }
  // What the client asked for, with what the algorithm adds, becomes the key's characteristics.
  secret_bytes key_data;
  if (TEE_Result r = descriptor->generate_key(&params, key_data, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  *error = check_blob_usage(params);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  return save_to(key_data.span(), params, response, response_length);
}

/// Writes blob length, blob, length of the parameters, parameters.
TEE_Result write_import_response(std::span<const uint8_t> key_data, const keymaster_key_param_set_t& params,
                                 std::span<uint8_t> response, uint32_t* response_length) {
  byte_writer out{response};
  std::span<uint8_t> blob_length_place, blob_place, params_length_place;
  uint32_t blob_length = 0, params_length = 0;
  if (!out.reserve(sizeof blob_length, blob_length_place)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  if (TEE_Result r = save_to(key_data, params, out.rest(), &blob_length); r != TEE_SUCCESS) return r;
  if (!out.reserve(blob_length, blob_place) || !out.reserve(sizeof params_length, params_length_place)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  if (TEE_Result r = marshal_to_slot(params, out.rest(), &params_length); r != TEE_SUCCESS) {
    TRACE_ERROR("Marshal failed");
    return r;
  }
  std::memcpy(blob_length_place.data(), &blob_length, sizeof blob_length);
  std::memcpy(params_length_place.data(), &params_length, sizeof params_length);
  *response_length = out.written() + params_length;
  return TEE_SUCCESS;
}

TEE_Result import(std::span<const uint8_t> request, std::span<uint8_t> response, uint32_t* response_length,
                  keymaster_error_t* error) {
  byte_reader in{request};
  std::span<const uint8_t> marshalled;
  if (TEE_Result r = read_field(in, marshalled); r != TEE_SUCCESS) return r;
  parameter_set params;
  if (TEE_Result r = unmarshal_key_params(marshalled, params); r != TEE_SUCCESS) return r;

  const keymaster_key_param_t* const tag = key_param_set_get_unique(params, KM_TAG_ALGORITHM);
  if (tag == nullptr) {
    TRACE_ERROR("No or too many KM_TAG_ALGORITHM");
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  const uint32_t algorithm = tag->enumerated;
  const keymaster_algorithm_descriptor* const descriptor = find_algorithm(algorithm);
  if (descriptor == nullptr || descriptor->import_key == nullptr) {
    TRACE_ERROR("Unsupport import_key for algorithm %s (%d)", descriptor == nullptr ? "" : descriptor->name, algorithm);
    *error = KM_ERROR_UNSUPPORTED_ALGORITHM;
    return TEE_SUCCESS;
  }
  secret_bytes material, key_data;
  if (!material.copy_of(in.rest())) {
    TRACE_ERROR("Out of memory");
    *error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  if (TEE_Result r = descriptor->import_key(&params, material.span(), key_data, error);
      r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  material.reset();
  *error = check_blob_usage(params);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;
  return write_import_response(key_data.span(), params, response, response_length);
}

/// A failed command leaves nothing of a half-made response to the client.
void clear_failed_response(TEE_Result result, keymaster_error_t error, std::span<uint8_t> response,
                           uint32_t* response_length) {
  if (result == TEE_SUCCESS && error == KM_ERROR_OK) return;
  if (!response.empty()) std::memset(response.data(), 0, response.size());
  *response_length = 0;
}

}  // namespace

TEE_Result generate_key(std::span<const uint8_t> request, std::span<uint8_t> response, uint32_t* response_length,
                        keymaster_error_t* error) {
  const TEE_Result result = generate(request, response, response_length, error);
  clear_failed_response(result, *error, response, response_length);
  return result;
}

TEE_Result import_key(std::span<const uint8_t> request, std::span<uint8_t> response, uint32_t* response_length,
                      keymaster_error_t* error) {
  const TEE_Result result = import(request, response, response_length, error);
  clear_failed_response(result, *error, response, response_length);
  return result;
}

}  // namespace keymaster
