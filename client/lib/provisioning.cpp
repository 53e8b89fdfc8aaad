#include "client/lib/provisioning.h"

#include <algorithm>
#include <array>
#include <stdexcept>

#include "client/lib/key_material.h"
#include "tee/companions/fingerprint/fingerprint_protocol.h"

namespace keymaster::client {
namespace {

namespace protocol = keymaster::provisioning;

constexpr TEEC_UUID this_ta = QUIL_TA_UUID;

/// The public half of a 2048-bit key has 294 bytes.
constexpr std::size_t public_key_capacity = 1024;

/// The parts of a private key in the order of private_key_material's layout.
constexpr std::array rsa_tags{QUIL_TAG_RSA_N, QUIL_TAG_RSA_E,  QUIL_TAG_RSA_D,  QUIL_TAG_RSA_P,
                              QUIL_TAG_RSA_Q, QUIL_TAG_RSA_DP, QUIL_TAG_RSA_DQ, QUIL_TAG_RSA_QINV};

/// An entry of a box: tag, length and value.
template <class Bytes>
void append_entry(Bytes& box, std::uint16_t tag, byte_view value) {
  if (value.size() > UINT16_MAX) {
    throw std::invalid_argument("an entry of a box is limited to 65535 bytes");
  }
  append_number(box, tag, 2);
  append_number(box, value.size(), 2);
  append_bytes(box, value);
}

void append_text(bytes& box, std::uint16_t tag, std::string_view text) {
  if (text.find('\0') != std::string_view::npos) {
    throw std::invalid_argument("the text has a zero in it");
  }
  bytes with_zero(text.begin(), text.end());
  with_zero.push_back(0);
  append_entry(box, tag, with_zero);
}

/// A UUID as it lies in the memory of a little-endian machine, which is how TAs compare it.
bytes memory_image(const TEEC_UUID& uuid) {
  bytes image;
  append_u32(image, uuid.timeLow);
  append_number(image, uuid.timeMid, 2);
  append_number(image, uuid.timeHiAndVersion, 2);
  append_bytes(image, uuid.clockSeqAndNode);
  return image;
}

bool is_printable(char c) {
  return c >= ' ' && c <= '~';
}

}  // namespace

const TEEC_UUID fingerprint_ta = FINGERPRINT_TA_UUID;

attestation_key read_attestation_key(byte_view file, std::optional<std::string_view> passphrase) {
  const private_key_material key = read_private_key(file, passphrase);
  if (key.algorithm != KM_ALGORITHM_RSA || key.key_size != protocol::attk_bits) {
    throw format_error("the attestation key must be an RSA key of " + std::to_string(protocol::attk_bits) + " bits");
  }
  attestation_key out;
  out.box.reserve(key.material.size());  // an entry's header is shorter than a field's length
  byte_reader in{key.material};
  for (const std::uint16_t tag : rsa_tags) {
    append_entry(out.box, tag, in.read_block());
  }
  out.public_key = public_half_der(key);
  return out;
}

provisioning::provisioning(connection& tee) : session_(tee, this_ta, "open_provisioning") {}

provisioning_status provisioning::status() {
  slots parameters{slot::value_out()};
  session_.call("provisioning_status", protocol::COMMAND_STATUS, parameters);
  const std::uint32_t mask = parameters[0].value().a;
  return {.key = (mask & protocol::STATUS_KEY) != 0,
          .data = (mask & protocol::STATUS_DATA) != 0,
          .soter_properties = (mask & protocol::STATUS_SOTER_PROPERTIES) != 0,
          .cpu_id = (mask & protocol::STATUS_CPU_ID) != 0,
          .device_id = (mask & protocol::STATUS_DEVICE_ID) != 0,
          .locked = (mask & protocol::STATUS_LOCKED) != 0};
}

bytes provisioning::generate_attk() {
  bytes der(public_key_capacity);
  slots parameters{slot::value_in(protocol::attk_bits), slot::bytes_out(der)};
  session_.call("generate_attk", protocol::COMMAND_GENERATE_ATTK, parameters);
  der.resize(parameters[1].size());
  return public_key_der(KM_ALGORITHM_RSA, der);
}

void provisioning::put_key(const attestation_key& key) {
  slots parameters{slot::bytes_in(key.box)};
  session_.call("put_key", protocol::COMMAND_PUT_KEY, parameters);
}

void provisioning::put_property(const quil_property_request& property, byte_view value) {
  bytes request;
  append_number(request, property.group, 2);
  append_number(request, property.item, 2);
  slots parameters{slot::bytes_in(request), slot::bytes_in(value)};
  session_.call("put_property", protocol::COMMAND_PUT_PROPERTY, parameters);
}

void provisioning::put_soter_properties(std::string_view sensor_name, std::string_view sensor_version,
                                        const TEEC_UUID& ta) {
  bytes box;
  append_text(box, QUIL_TAG_FP_SENSOR_NAME, sensor_name);
  append_text(box, QUIL_TAG_FP_SENSOR_VERSION, sensor_version);
  append_entry(box, QUIL_TAG_FP_UUID, memory_image(ta));
  if (box.size() > protocol::property_limit) {
    throw std::invalid_argument("the sensor's name and version are too long");
  }
  put_property(QUIL_PROPERTY_SOTER, box);
}

void provisioning::put_cpu_id(std::string_view id) {
  if (id.empty() || id.size() > longest_cpu_id || !std::ranges::all_of(id, is_printable)) {
    throw std::invalid_argument("a cpu id has 1 to 63 printable ASCII characters");
  }
  put_property(QUIL_PROPERTY_CPU_ID, as_bytes(id));
}

void provisioning::put_device_id(byte_view id) {
  if (id.size() < shortest_device_id || id.size() > longest_device_id) {
    throw std::invalid_argument("a device id has 16 to 32 bytes");
  }
  put_property(QUIL_PROPERTY_DEVICE_ID, id);
}

void provisioning::lock() {
  slots parameters{};
  session_.call("lock_device", protocol::COMMAND_LOCK, parameters);
}

}  // namespace keymaster::client
