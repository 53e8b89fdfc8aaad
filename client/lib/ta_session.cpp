#include "client/lib/ta_session.h"

#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

slot memory(std::uint32_t type, std::uint8_t* data, std::size_t size) {
  slot out{.type = type};
  out.parameter.tmpref = {.buffer = data, .size = size};
  return out;
}

slot words(std::uint32_t type, std::uint32_t a, std::uint32_t b) {
  slot out{.type = type};
  out.parameter.value = {.a = a, .b = b};
  return out;
}

}  // namespace

slot slot::bytes_in(byte_view data) {
  // The standard's structure serves both directions and so has no const; an input buffer is only read.
  return memory(TEEC_MEMREF_TEMP_INPUT, const_cast<std::uint8_t*>(data.data()), data.size());
}

slot slot::bytes_out(std::span<std::uint8_t> room) {
  return memory(TEEC_MEMREF_TEMP_OUTPUT, room.data(), room.size());
}

slot slot::value_in(std::uint32_t a, std::uint32_t b) {
  return words(TEEC_VALUE_INPUT, a, b);
}

slot slot::value_out() {
  return words(TEEC_VALUE_OUTPUT, 0, 0);
}

slot slot::value_inout(std::uint32_t a, std::uint32_t b) {
  return words(TEEC_VALUE_INOUT, a, b);
}

slot slot::number_in(std::uint64_t number) {
  return value_in(static_cast<std::uint32_t>(number), static_cast<std::uint32_t>(number >> 32));
}

std::uint64_t slot::number() const {
  return std::uint64_t{value().b} << 32 | value().a;
}

ta_session::ta_session(connection& tee, const TEEC_UUID& ta, const char* step) {
  std::uint32_t origin = 0;
  const TEEC_Result result =
      TEEC_OpenSession(&tee.context(), &session_, &ta, TEEC_LOGIN_PUBLIC, nullptr, nullptr, &origin);
  if (result != TEEC_SUCCESS) {
    throw error({.kind = error_kind::connection, .step = step, .tee_result = result, .tee_origin = origin});
  }
}

outcome ta_session::invoke(std::uint32_t command, slots& parameters) {
  TEEC_Operation operation{};
  operation.paramTypes =
      TEEC_PARAM_TYPES(parameters[0].type, parameters[1].type, parameters[2].type, parameters[3].type);
  for (std::size_t i = 0; i < parameters.size(); ++i) {
    operation.params[i] = parameters[i].parameter;
  }
  outcome done;
  done.result = TEEC_InvokeCommand(&session_, command, &operation, &done.origin);
  for (std::size_t i = 0; i < parameters.size(); ++i) {
    parameters[i].parameter = operation.params[i];
  }
  return done;
}

void ta_session::call(const char* step, std::uint32_t command, slots& parameters) {
  slots given = parameters;
  const outcome done = invoke(command, parameters);
  if (done.result != TEEC_SUCCESS) {
    throw error({.kind = error_kind::companion, .step = step, .tee_result = done.result, .tee_origin = done.origin});
  }
  for (std::size_t i = 0; i < parameters.size(); ++i) {
    if (given[i].type == TEEC_MEMREF_TEMP_OUTPUT && parameters[i].size() > given[i].size()) {
      throw format_error(std::string(step) + " says that it wrote " + std::to_string(parameters[i].size()) +
                         " bytes where there was room for " + std::to_string(given[i].size()));
    }
  }
}

}  // namespace keymaster::client
