// What a client must know to talk to the TA "device information" of the hosted TEE: properties are for TAs alone, so
// this one reads them for the normal world. docs/hosted-tee.md tells more.
#ifndef TEE_CLIENT_DEVICE_INFORMATION_H_
#define TEE_CLIENT_DEVICE_INFORMATION_H_

#include <cstdint>

namespace hosted_tee {

/// The TA's UUID, 4ed21263-83ea-49cf-9dc2-df1dc8810689, field by field as TEE_UUID and TEEC_UUID have it.
#define DEVICE_INFORMATION_TA_UUID                   \
  {                                                  \
    0x4ed21263, 0x83ea, 0x49cf, {                    \
      0x9d, 0xc2, 0xdf, 0x1d, 0xc8, 0x81, 0x06, 0x89 \
    }                                                \
  }

/// The slots of a command are used from the first on, and the types of all four must be exactly those told here.
///
/// A property's name is 1 to device_information_name_limit bytes without a zero. Its value is the text form of the
/// Internal Core API, with the zero at its end; when the slot is too small the result is TEE_ERROR_SHORT_BUFFER and the
/// slot's size the one that is needed. On every other failure that size is zero.
///
/// Errors: TEE_ERROR_BAD_PARAMETERS (types, a name or UUID of another form), TEE_ERROR_ITEM_NOT_FOUND (no such property
/// or TA), TEE_ERROR_BAD_FORMAT (what lies there is not an image of that TA), TEE_ERROR_NOT_SUPPORTED (command number).
enum device_information_command_t : std::uint32_t {
  /// A property of the TEE. MEMREF_INPUT name, MEMREF_OUTPUT value.
  DEVICE_INFORMATION_GET_TEE_PROPERTY = 1,
  /// A property of a TA, running or not. MEMREF_INPUT the TA's UUID (16 bytes in the order of its text form),
  /// MEMREF_INPUT name, MEMREF_OUTPUT value.
  DEVICE_INFORMATION_GET_TA_PROPERTY = 2,
  /// What the device is like now. VALUE_OUTPUT `a`: 1 when the RPMB storage can be used, else 0; VALUE_OUTPUT the
  /// system time and VALUE_OUTPUT the REE time, each seconds in `a` and milliseconds in `b`.
  DEVICE_INFORMATION_GET_STATE = 3,
};

inline constexpr std::uint32_t device_information_name_limit = 127;

}  // namespace hosted_tee

#endif  // TEE_CLIENT_DEVICE_INFORMATION_H_
