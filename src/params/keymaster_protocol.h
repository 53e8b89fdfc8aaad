// What a client must know to talk to the TA: its UUID and its command numbers. docs/protocol.md tells the bodies.
#ifndef KEYMASTER_PARAMS_KEYMASTER_PROTOCOL_H_
#define KEYMASTER_PARAMS_KEYMASTER_PROTOCOL_H_

#include <cstdint>

namespace keymaster {

/// The TA's UUID, fbacea43-f475-4df3-866f-76256aba994f, field by field as TEE_UUID and TEEC_UUID have it.
#define KEYMASTER_TA_UUID                            \
  {                                                  \
    0xfbacea43, 0xf475, 0x4df3, {                    \
      0x86, 0x6f, 0x76, 0x25, 0x6a, 0xba, 0x99, 0x4f \
    }                                                \
  }

enum keymaster_command_t : uint32_t {
  KM_COMMAND_GET_SUPPORT_ALGO_CNT = 1,
  KM_COMMAND_GET_SUPPORT_ALGO = 2,
  KM_COMMAND_GET_SUPPORT_BLK_MODE_CNT = 3,
  KM_COMMAND_GET_SUPPORT_BLK_MODE = 4,
  KM_COMMAND_GET_SUPPORT_PADDING_MODE_CNT = 5,
  KM_COMMAND_GET_SUPPORT_PADDING_MODE = 6,
  KM_COMMAND_GET_SUPPORT_DIGEST_CNT = 7,
  KM_COMMAND_GET_SUPPORT_DIGEST = 8,
  KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT_CNT = 9,
  KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT = 10,
  KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT_CNT = 11,
  KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT = 12,
  KM_COMMAND_GENERATE_KEY = 13,
  KM_COMMAND_GET_KEY_CHARACTER_SIZE = 14,
  KM_COMMAND_GET_KEY_CHARACTER = 15,
  KM_COMMAND_BEGIN = 16,
  KM_COMMAND_UPDATE = 17,
  KM_COMMAND_FINISH = 18,
  KM_COMMAND_IMPORT_KEY = 19,
  KM_COMMAND_EXPORT_KEY = 20,
  KM_COMMAND_DELETE_KEY = 21,
  KM_COMMAND_DELETE_ALL_KEY = 22,
  KM_COMMAND_ABORT = 23,
  KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR = 0xFF00,
  KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR = 0xFF01,
  KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY = 0xFF02,
  KM_COMMAND_SOTER_GET_DEVICE_ID = 0xFF03,
  KM_COMMAND_SOTER_SET_FID = 0xFF04,
};

/// What the soter commands answer in slot 0 beside the Keymaster errors. The numbers overlap with those, so a client
/// reads them by the command that it sent.
enum soter_status_t : int32_t {
  SOTER_STATUS_OK = 0,
  SOTER_STATUS_NO_ATTK = -1,          ///< no attestation key is provisioned, or (export) it can't be loaded
  SOTER_STATUS_UNREADABLE_ATTK = -2,  ///< there may be one, and reading it failed
};

/// What the fingerprint TA sends with KM_COMMAND_SOTER_SET_FID: u32 version, u32 finger id, u64 system time in ms.
inline constexpr uint32_t SOTER_FID_MESSAGE_SIZE = 16;
inline constexpr uint32_t SOTER_FID_MESSAGE_VERSION = 0;

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_KEYMASTER_PROTOCOL_H_
