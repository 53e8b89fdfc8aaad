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

/// Asks for the text that the command puts into slot `place`, with as much room as it turns out to need.
std::optional<std::string> read_text(ta_session& session, const char* step, device_information_command_t command,
                                     slots& parameters, std::size_t place) {
  bytes text(usual_size);
  for (;;) {
    parameters[place] = slot::bytes_out(text);
    const outcome done = session.invoke(command, parameters);
    const std::size_t size = parameters[place].size();
    if (done.result == TEEC_SUCCESS) {
      text.resize(std::min(size, text.size()));
      const std::string_view value = as_text(text);
      return std::string(value.substr(0, value.find('\0')));
    }
    if (done.result == TEEC_ERROR_ITEM_NOT_FOUND) {
      return std::nullopt;
    }
    if (done.result != TEEC_ERROR_SHORT_BUFFER) {
      throw error({.kind = error_kind::companion, .step = step, .tee_result = done.result, .tee_origin = done.origin});
    }
    if (size <= text.size() || size > longest_value) {
      throw format_error("a property asks for " + std::to_string(size) + " bytes");
    }
    text.resize(size);
  }
}

}  // namespace

device_information::device_information(connection& tee)
    : session_(tee, device_information_ta, "open_device_information") {}

std::optional<std::string> device_information::tee_property(std::string_view name) {
  slots parameters{slot::bytes_in(as_bytes(name))};
  return read_text(session_, "get_tee_property", DEVICE_INFORMATION_GET_TEE_PROPERTY, parameters, 1);
}

std::optional<std::string> device_information::ta_property(const TEEC_UUID& ta, std::string_view name) {
  const auto uuid = network_order(ta);
  slots parameters{slot::bytes_in(uuid), slot::bytes_in(as_bytes(name))};
  return read_text(session_, "get_ta_property", DEVICE_INFORMATION_GET_TA_PROPERTY, parameters, 2);
}

device_state device_information::state() {
  slots parameters{slot::value_out(), slot::value_out(), slot::value_out()};
  session_.call("get_device_state", DEVICE_INFORMATION_GET_STATE, parameters);
  return {.has_rpmb = parameters[0].value().a != 0,
          .system_time = milliseconds(parameters[1].value()),
          .ree_time = milliseconds(parameters[2].value())};
}

}  // namespace keymaster::client
