#include "ta/operation_commands.h"

#include <cstring>

#include "auth/authorization.h"
#include "auth/operation_pool.h"
#include "params/algorithm.h"
#include "params/dump.h"
#include "params/marshal.h"
#include "platform/trace.h"
#include "ta/command_slots.h"
#include "ta/operation_owner.h"

namespace keymaster {
namespace {

/// The request of update and finish.
struct step_arguments {
  std::span<const uint8_t> input;  // client memory; goes to the platform, or is copied, exactly once
  parameter_set in_params;
};

/// Reads the request and asks whether the operation may go on.
TEE_Result read_and_authorize(std::span<const uint8_t> request, const keymaster_operation_t& operation, uint32_t handle,
                              step_arguments& arguments, keymaster_error_t* error) {
  byte_reader in{request};
  std::span<const uint8_t> marshalled;
  if (TEE_Result r = read_field(in, arguments.input); r != TEE_SUCCESS) return r;
  if (TEE_Result r = read_field(in, marshalled); r != TEE_SUCCESS) {
    arguments.input = {};
    return r;
  }
  if (unmarshal(marshalled, &arguments.in_params) != TEE_SUCCESS) {
    TRACE_ERROR("Unmarshal failed");
    *error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  KEYMASTER_DUMP_KEY_PARAM_SET(arguments.in_params);
  const TEE_Result result = authorize_update_or_finish(arguments.in_params, operation, handle, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) TRACE_ERROR("Authorization failed");
  return result;
}

TEE_Result run_update(keymaster_operation_t* operation, const step_arguments& arguments, std::span<uint8_t> response,
                      uint32_t* response_length, keymaster_error_t* error, uint32_t* input_consumed) {
  if (operation->update == nullptr) {
    TRACE_ERROR("Update not implemented");
    *error = KM_ERROR_UNIMPLEMENTED;
    return TEE_SUCCESS;
  }
  *response_length = static_cast<uint32_t>(response.size());
  const TEE_Result result = operation->update(operation, arguments.in_params, arguments.input, input_consumed,
                                              response.data(), response_length, error);
  if (*response_length > response.size()) *error = KM_ERROR_UNKNOWN_ERROR;  // more than can have been written
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) TRACE_ERROR("Update failed");
  return result;
}

TEE_Result run_finish(keymaster_operation_t* operation, const step_arguments& arguments, secret_bytes& output,
                      parameter_set& out_params, keymaster_error_t* error) {
  if (operation->finish == nullptr) {
    TRACE_ERROR("Finish not implemented");
    *error = KM_ERROR_UNIMPLEMENTED;
    return TEE_SUCCESS;
  }
  const TEE_Result result =
      operation->finish(operation, arguments.in_params, arguments.input, output, out_params, error);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) TRACE_ERROR("Finish failed");
  return result;
}

void destroy(keymaster_operation_t* operation, uint32_t handle) {
  operation_owner{operation}.reset();
  operation_pool_remove(handle);
}

TEE_Result write_finish_response(const secret_bytes& output, const keymaster_key_param_set_t& out_params,
                                 std::span<uint8_t> response, uint32_t* response_length) {
  byte_writer out{response};
  std::span<uint8_t> params_length_place;
  if (!out.write_u32(output.size()) || !out.write_bytes(output.data(), output.size()) ||
      !out.reserve(sizeof(uint32_t), params_length_place)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  uint32_t params_length = 0;
  if (TEE_Result r = marshal_to_slot(out_params, out.rest(), &params_length); r != TEE_SUCCESS) {
    TRACE_ERROR("Marshal failed");
    return r;
  }
  std::memcpy(params_length_place.data(), &params_length, sizeof params_length);
  *response_length = out.written() + params_length;
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result update(uint32_t handle, std::span<const uint8_t> request, std::span<uint8_t> response,
                  uint32_t* response_length, keymaster_error_t* error, uint32_t* input_consumed) {
  *input_consumed = 0;
  keymaster_operation_t* const operation = operation_pool_get(handle);
  if (operation == nullptr) {
    *error = KM_ERROR_INVALID_OPERATION_HANDLE;
    return TEE_SUCCESS;
  }
  step_arguments arguments;
  TEE_Result result = read_and_authorize(request, *operation, handle, arguments, error);
  *input_consumed = static_cast<uint32_t>(arguments.input.size());
  if (result == TEE_SUCCESS && *error == KM_ERROR_OK) {
    result = run_update(operation, arguments, response, response_length, error, input_consumed);
  }
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) destroy(operation, handle);
  return result;
}

TEE_Result finish(uint32_t handle, std::span<const uint8_t> request, std::span<uint8_t> response,
                  uint32_t* response_length, keymaster_error_t* error) {
  keymaster_operation_t* const operation = operation_pool_get(handle);
  if (operation == nullptr) {
    *error = KM_ERROR_INVALID_OPERATION_HANDLE;
    return TEE_SUCCESS;
  }
  step_arguments arguments;
  secret_bytes output;
  parameter_set out_params;
  TEE_Result result = read_and_authorize(request, *operation, handle, arguments, error);
  if (result == TEE_SUCCESS && *error == KM_ERROR_OK) {
    result = run_finish(operation, arguments, output, out_params, error);
  }
  destroy(operation, handle);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) return result;
  return write_finish_response(output, out_params, response, response_length);
}

TEE_Result abort(uint32_t handle, keymaster_error_t* error) {
  keymaster_operation_t* const operation = operation_pool_get(handle);
  if (operation == nullptr) {
    *error = KM_ERROR_INVALID_OPERATION_HANDLE;
    return TEE_SUCCESS;
  }
  destroy(operation, handle);
  *error = KM_ERROR_OK;
  return TEE_SUCCESS;
}

}  // namespace keymaster
