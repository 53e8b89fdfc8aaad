#include "client/lib/device_information.h"

#include <algorithm>
#include <array>

#include "client/lib/wire.h"
#include "tee/client/device_information.h"

namespace keymaster::client {
namespace {

using namespace hosted_tee;

constexpr TEEC_UUID device_information_ta = DEVICE_INFORMATION_TA_UUID;
constexpr std::size_t usual_size = 256;
constexpr std::size_t longest_value = 65536;  // far beyond any property; a longer one is not an answer

TEEC_Parameter input(byte_view data) {
  TEEC_Parameter slot{};
  // The standard's structure serves both directions and so has no const; an input buffer is only read.
  slot.tmpref = {.buffer = const_cast<std::uint8_t*>(data.data()), .size = data.size()};
  return slot;
}

/// The bytes of a UUID in the order of its text form (RFC 4122).
std::array<std::uint8_t, 16> network_order(const TEEC_UUID& uuid) {
  std::array<std::uint8_t, 16> out{};
  const std::uint64_t fields =
      std::uint64_t{uuid.timeLow} << 32 | std::uint64_t{uuid.timeMid} << 16 | std::uint64_t{uuid.timeHiAndVersion};
  for (std::size_t i = 0; i < 8; ++i) {
    out[i] = static_cast<std::uint8_t>(fields >> (56 - 8 * i));
    out[8 + i] = uuid.clockSeqAndNode[i];
  }
  return out;
}

std::uint64_t milliseconds(const TEEC_Value& time) {
  return std::uint64_t{time.a} * 1000 + time.b;
}

[[noreturn]] void refuse(const char* step, TEEC_Result result, std::uint32_t origin) {
  throw error({.kind = error_kind::tee, .step = step, .tee_result = result, .tee_origin = origin});
}

/// Asks for the text that the command puts into slot `place`, with as much room as it turns out to need.
std::optional<std::string> read_text(TEEC_Session& session, const char* step, device_information_command_t command,
                                     TEEC_Operation& operation, std::size_t place) {
  std::string text(usual_size, '\0');
  for (;;) {
    auto& slot = operation.params[place].tmpref;
    slot = {.buffer = text.data(), .size = text.size()};
    std::uint32_t origin = 0;
    const TEEC_Result result = TEEC_InvokeCommand(&session, command, &operation, &origin);
    if (result == TEEC_SUCCESS) {
      text.resize(std::min(slot.size, text.size()));
      return text.substr(0, text.find('\0'));
    }
    if (result == TEEC_ERROR_ITEM_NOT_FOUND) {
      return std::nullopt;
    }
    if (result != TEEC_ERROR_SHORT_BUFFER) {
      refuse(step, result, origin);
    }
    if (slot.size <= text.size() || slot.size > longest_value) {
      throw format_error("a property asks for " + std::to_string(slot.size) + " bytes");
    }
    text.resize(slot.size);
  }
}

}  // namespace

device_information::device_information(connection& tee) {
  std::uint32_t origin = 0;
  const TEEC_Result result =
      TEEC_OpenSession(&tee.context(), &session_, &device_information_ta, TEEC_LOGIN_PUBLIC, nullptr, nullptr, &origin);
  if (result != TEEC_SUCCESS) {
    throw error({.kind = error_kind::connection,
                 .step = "open_device_information",
                 .tee_result = result,
                 .tee_origin = origin});
  }
}

std::optional<std::string> device_information::tee_property(std::string_view name) {
  TEEC_Operation operation{};
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE, TEEC_NONE);
  operation.params[0] = input(as_bytes(name));
  return read_text(session_, "get_tee_property", DEVICE_INFORMATION_GET_TEE_PROPERTY, operation, 1);
}

std::optional<std::string> device_information::ta_property(const TEEC_UUID& ta, std::string_view name) {
  const auto uuid = network_order(ta);
  TEEC_Operation operation{};
  operation.paramTypes =
      TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE);
  operation.params[0] = input(uuid);
  operation.params[1] = input(as_bytes(name));
  return read_text(session_, "get_ta_property", DEVICE_INFORMATION_GET_TA_PROPERTY, operation, 2);
}

device_state device_information::state() {
  TEEC_Operation operation{};
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_OUTPUT, TEEC_VALUE_OUTPUT, TEEC_VALUE_OUTPUT, TEEC_NONE);
  std::uint32_t origin = 0;
  const TEEC_Result result = TEEC_InvokeCommand(&session_, DEVICE_INFORMATION_GET_STATE, &operation, &origin);
  if (result != TEEC_SUCCESS) {
    refuse("get_device_state", result, origin);
  }
  return {.has_rpmb = operation.params[0].value.a != 0,
          .system_time = milliseconds(operation.params[1].value),
          .ree_time = milliseconds(operation.params[2].value)};
}

}  // namespace keymaster::client
