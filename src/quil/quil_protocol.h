// What the provisioning TA ("quil") and its clients share: its UUID, command numbers, property requests and the tags of
// its boxes. This header depends on nothing, so that the provisioning TA includes the very same one.
#ifndef KEYMASTER_QUIL_QUIL_PROTOCOL_H_
#define KEYMASTER_QUIL_QUIL_PROTOCOL_H_

#include <cstdint>

namespace keymaster {

/// The UUID d625ee97-fb6f-4498-b282-a3f85d9413c5, field by field as TEE_UUID and TEEC_UUID have it.
#define QUIL_TA_UUID                                 \
  {                                                  \
    0xd625ee97, 0xfb6f, 0x4498, {                    \
      0xb2, 0x82, 0xa3, 0xf8, 0x5d, 0x94, 0x13, 0xc5 \
    }                                                \
  }

/// The commands that this TA sends. The key and data commands fill slot 0 and tell the length in slot 1 `a`; the
/// property command takes a request in slot 0 and answers in slot 1.
enum quil_command_t : uint32_t {
  QUIL_COMMAND_GET_KEY = 2,
  QUIL_COMMAND_GET_DATA = 5,
  QUIL_COMMAND_GET_PROPERTY = 12,
};

/// A property request: two little-endian words.
struct quil_property_request {
  uint16_t group;
  uint16_t item;
};
static_assert(sizeof(quil_property_request) == 4);

inline constexpr quil_property_request QUIL_PROPERTY_SOTER = {0x1834, 0x0000};
inline constexpr quil_property_request QUIL_PROPERTY_CPU_ID = {0x1734, 0x173A};
inline constexpr quil_property_request QUIL_PROPERTY_DEVICE_ID = {0x1934, 0x1936};

/// The entries of the property box.
inline constexpr uint16_t QUIL_TAG_FP_SENSOR_NAME = 0x1835;
inline constexpr uint16_t QUIL_TAG_FP_SENSOR_VERSION = 0x1836;
inline constexpr uint16_t QUIL_TAG_FP_UUID = 0x1837;

/// The entries of the key box: big-endian magnitudes. A key may have the first three alone.
inline constexpr uint16_t QUIL_TAG_RSA_N = 17;
inline constexpr uint16_t QUIL_TAG_RSA_E = 18;
inline constexpr uint16_t QUIL_TAG_RSA_D = 19;
inline constexpr uint16_t QUIL_TAG_RSA_P = 20;
inline constexpr uint16_t QUIL_TAG_RSA_Q = 21;
inline constexpr uint16_t QUIL_TAG_RSA_DP = 22;
inline constexpr uint16_t QUIL_TAG_RSA_DQ = 23;
inline constexpr uint16_t QUIL_TAG_RSA_QINV = 24;

/// The most that is asked for at once.
inline constexpr uint32_t QUIL_KEY_CAPACITY = 8192;
inline constexpr uint32_t QUIL_PROPERTY_CAPACITY = 512;
inline constexpr uint32_t QUIL_CPU_ID_CAPACITY = 64;

}  // namespace keymaster

#endif  // KEYMASTER_QUIL_QUIL_PROTOCOL_H_
