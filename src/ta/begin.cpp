#include "auth/application_binding.h"
#include "auth/authorization.h"
#include "auth/operation_pool.h"
#include "keystore/key_blob.h"
#include "params/dump.h"
#include "params/marshal.h"
#include "platform/trace.h"
#include "ta/algorithm_registry.h"
#include "ta/command_slots.h"
#include "ta/operation_commands.h"
#include "ta/operation_owner.h"

namespace keymaster {
namespace {

struct begin_arguments {
  heap_bytes blob;
  parameter_set in_params;
};

TEE_Result read_begin(std::span<const uint8_t> request, begin_arguments& arguments, keymaster_error_t* error) {
  byte_reader in{request};
  std::span<const uint8_t> blob, marshalled;
  if (TEE_Result r = read_field(in, blob); r != TEE_SUCCESS) return r;
  if (TEE_Result r = read_field(in, marshalled); r != TEE_SUCCESS) return r;
  if (unmarshal(marshalled, &arguments.in_params) != TEE_SUCCESS) {
    TRACE_ERROR("Unmarshal failed");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  KEYMASTER_DUMP_KEY_PARAM_SET(arguments.in_params);
  (void)copy_field(blob, arguments.blob, error);
  return TEE_SUCCESS;
}

std::span<const uint8_t> unique_blob(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  const keymaster_key_param_t* const param = key_param_set_get_unique(set, tag);
  return param == nullptr ? std::span<const uint8_t>{} : blob_bytes(*param);
}

/// Opens the key and decides whether it may be used so.
TEE_Result open_and_authorize(const begin_arguments& arguments, uint32_t purpose, secret_bytes& key_data,
                              parameter_set& characteristics, keymaster_error_t* error) {
  const std::span<const uint8_t> blob = arguments.blob.span();
  if (TEE_Result r = open_key(blob, key_data, characteristics, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    TRACE_ERROR("Open key failed");
    return r;
  }
  if (check_app_id_and_app_data(characteristics, unique_blob(arguments.in_params, KM_TAG_APPLICATION_ID),
                                unique_blob(arguments.in_params, KM_TAG_APPLICATION_DATA)) != 0) {
    TRACE_ERROR("Wrong AppId or AppData");
    *error = KM_ERROR_INVALID_KEY_BLOB;
    return TEE_SUCCESS;
  }
  const TEE_Result result = authorize_begin(blob, purpose, arguments.in_params, characteristics, error);
  if (result == TEE_SUCCESS && *error == KM_OP_AUTH_NEEDED) *error = KM_ERROR_OK;
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) TRACE_ERROR("Authorization failed");
  return result;
}

keymaster_error_t find_constructor(const keymaster_key_param_set_t& characteristics, uint32_t purpose,
                                   const keymaster_purpose_ops** ops) {
  const keymaster_key_param_t* const algorithm = key_param_set_find_next(characteristics, KM_TAG_ALGORITHM, nullptr);
  if (algorithm == nullptr) {
    TRACE_ERROR("No KM_TAG_ALGORITHM");
    return KM_ERROR_UNKNOWN_ERROR;
  }
  const keymaster_algorithm_descriptor* const descriptor = find_algorithm(algorithm->enumerated);
  if (descriptor == nullptr || descriptor->get_purpose_ops == nullptr) {
    TRACE_ERROR("Algorithm %d not implemented", algorithm->enumerated);
    return KM_ERROR_UNSUPPORTED_ALGORITHM;
  }
  *ops = descriptor->get_purpose_ops(purpose);
  if (*ops == nullptr || (*ops)->create_operation == nullptr) {
    TRACE_ERROR("Algorithm %s purpose %d not implemented", descriptor->name, purpose);
    return KM_ERROR_UNSUPPORTED_PURPOSE;
  }
  return KM_ERROR_OK;
}

/// Builds the operation, which takes the characteristics over.
TEE_Result create(uint32_t purpose, std::span<const uint8_t> key_data, parameter_set& characteristics,
                  const keymaster_key_param_set_t& in_params, parameter_set& out_params, operation_owner& operation,
                  keymaster_error_t* error) {
  const keymaster_purpose_ops* ops = nullptr;
  *error = find_constructor(characteristics, purpose, &ops);
  if (*error != KM_ERROR_OK) return TEE_SUCCESS;

  TEE_Result result = TEE_SUCCESS;
  operation.reset(ops->create_operation({key_data, characteristics, in_params, out_params}, &result, error));
  if (!operation) {
    TRACE_ERROR("Create operation failed");
    // A failure that says nothing: both codes zero would look like success.
    if (result == TEE_SUCCESS && *error == KM_ERROR_OK) *error = KM_ERROR_UNKNOWN_ERROR;
    return result;
  }
  operation->purpose = purpose;
  operation->authorization_set = characteristics.release();
  return TEE_SUCCESS;
}

/// Files the operation and answers its out parameters; it stays with `operation` unless both succeed.
TEE_Result file_operation(operation_owner& operation, const keymaster_key_param_set_t& out_params,
                          std::span<uint8_t> response, uint32_t* response_length, keymaster_error_t* error,
                          uint32_t* handle) {
  if (TEE_Result r = operation_pool_add(operation.get(), handle, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    TRACE_ERROR("Allocate in operation pool failed");
    return r;
  }
  if (TEE_Result r = marshal_to_slot(out_params, response, response_length); r != TEE_SUCCESS) {
    TRACE_ERROR("Marshal failed");
    operation_pool_remove(*handle);
    *handle = 0;
    return r;
  }
  (void)operation.release();
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result begin(uint32_t purpose, std::span<const uint8_t> request, std::span<uint8_t> response,
                 uint32_t* response_length, keymaster_error_t* error, uint32_t* handle) {
  *handle = 0;
  begin_arguments arguments;
  if (TEE_Result r = read_begin(request, arguments, error); r != TEE_SUCCESS || *error != KM_ERROR_OK) return r;
  secret_bytes key_data;
  parameter_set characteristics, out_params;
  operation_owner operation;
  if (TEE_Result r = open_and_authorize(arguments, purpose, key_data, characteristics, error);
      r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  if (TEE_Result r =
          create(purpose, key_data.span(), characteristics, arguments.in_params, out_params, operation, error);
      r != TEE_SUCCESS || *error != KM_ERROR_OK) {
    return r;
  }
  return file_operation(operation, out_params, response, response_length, error, handle);
}

}  // namespace keymaster
