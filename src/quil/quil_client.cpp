#include "quil/quil_client.h"

#include "platform/handles.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr TEE_UUID quil_uuid = QUIL_TA_UUID;

constexpr uint32_t fetch_types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_VALUE_OUTPUT, 0, 0);
constexpr uint32_t property_types = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0, 0);
static_assert(fetch_types == 0x26 && property_types == 0x65);

/// Has `command` fill the buffer; slot 1 tells the length.
TEE_Result fetch(const ta_session& session, uint32_t command, void* buf, uint32_t buf_len, uint32_t* length) {
  TEE_Param params[4] = {};
  params[0].memref = {buf, buf_len};
  params[1].value = {0, 0};
  const TEE_Result result = session.invoke(command, fetch_types, params);
  *length = params[1].value.a;
  return result;
}

}  // namespace

TEE_Result retrieve_key_from_quil(void* buf, uint32_t buf_len, uint32_t* used_length) {
  if (buf == nullptr) {
    TRACE_ERROR("Buf is null\n");
    return TEE_ERROR_SHORT_BUFFER;
  }
  if (used_length == nullptr) {
    TRACE_ERROR("used_length pointer is null\n");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  ta_session session;
  if (TEE_Result r = session.open(quil_uuid); r != TEE_SUCCESS) {
    TRACE_ERROR("Open quil session fails, 0x%x\n", r);
    return r;
  }
  uint32_t length = 0;
  if (TEE_Result r = fetch(session, QUIL_COMMAND_GET_KEY, buf, buf_len, &length); r != TEE_SUCCESS) {
    TRACE_ERROR("Retrieve key fails, 0x%x\n", r);
    return r;
  }
  *used_length = length;
  TRACE_DEBUG("Retrieve key success\n");
  return TEE_SUCCESS;
}

// Its argument faults are of lower rank than those of its twin: nothing depends on the data.
TEE_Result retrieve_data_from_quil(void* buf, uint32_t buf_len, uint32_t* used_length) {
  if (buf == nullptr) {
    TRACE_DEBUG("Buf is null\n");
    return TEE_ERROR_SHORT_BUFFER;
  }
  if (used_length == nullptr) {
    TRACE_DEBUG("used_length pointer is null\n");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  ta_session session;
  if (TEE_Result r = session.open(quil_uuid); r != TEE_SUCCESS) {
    TRACE_ERROR("Open quil session fails, 0x%x\n", r);
    return r;
  }
  uint32_t length = 0;
  if (TEE_Result r = fetch(session, QUIL_COMMAND_GET_DATA, buf, buf_len, &length); r != TEE_SUCCESS) {
    TRACE_INFO("Retrieve TA data fails, 0x%x\n", r);
    return r;
  }
  *used_length = length;
  TRACE_DEBUG("Retrieve TA data success\n");
  return TEE_SUCCESS;
}

TEE_Result retrieve_property_from_quil(const quil_property_request* request, void* output, uint32_t* output_length) {
  if (request == nullptr || output == nullptr) {
    TRACE_ERROR("request %p output %p\n", static_cast<const void*>(request), output);
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (output_length == nullptr) {
    TRACE_ERROR("output_length pointer is null\n");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  ta_session session;
  if (TEE_Result r = session.open(quil_uuid); r != TEE_SUCCESS) {
    TRACE_ERROR("Open quil session fails, 0x%x\n", r);
    return r;
  }
  quil_property_request sent = *request;  // a parameter has no room for "only read"
  TEE_Param params[4] = {};
  params[0].memref = {&sent, sizeof sent};
  params[1].memref = {output, *output_length};
  if (TEE_Result r = session.invoke(QUIL_COMMAND_GET_PROPERTY, property_types, params); r != TEE_SUCCESS) {
    TRACE_ERROR("Retrieve TA property fails, 0x%x\n", r);
    return r;
  }
  *output_length = params[1].memref.size;
  TRACE_DEBUG("Retrieve TA property success\n");
  return TEE_SUCCESS;
}

}  // namespace keymaster
