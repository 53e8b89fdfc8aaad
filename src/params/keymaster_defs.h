// The public Keymaster definitions: tags, enumerations and error codes, as clients and the TA both use them.
// Numbers are those of the public Android Keymaster (version 1) definitions. This header depends on nothing, so that
// programs of the normal world can include it.
#ifndef KEYMASTER_PARAMS_KEYMASTER_DEFS_H_
#define KEYMASTER_PARAMS_KEYMASTER_DEFS_H_

#include <cstdint>

namespace keymaster {

/// The type of a tag's value: the top 4 bits of the tag.
enum keymaster_tag_type_t : uint32_t {
  KM_INVALID = 0x00000000,
  KM_ENUM = 0x10000000,
  KM_ENUM_REP = 0x20000000,
  KM_UINT = 0x30000000,
  KM_UINT_REP = 0x40000000,
  KM_ULONG = 0x50000000,
  KM_DATE = 0x60000000,
  KM_BOOL = 0x70000000,
  KM_BIGNUM = 0x80000000,
  KM_BYTES = 0x90000000,
  KM_ULONG_REP = 0xA0000000,
};

/// Tag type and number. Any 32-bit value may come from a client, so it is a number here and not an enumeration.
using keymaster_tag_t = uint32_t;

inline constexpr keymaster_tag_t KM_TAG_PURPOSE = KM_ENUM_REP | 1;
inline constexpr keymaster_tag_t KM_TAG_ALGORITHM = KM_ENUM | 2;
inline constexpr keymaster_tag_t KM_TAG_KEY_SIZE = KM_UINT | 3;
inline constexpr keymaster_tag_t KM_TAG_BLOCK_MODE = KM_ENUM_REP | 4;
inline constexpr keymaster_tag_t KM_TAG_DIGEST = KM_ENUM_REP | 5;
inline constexpr keymaster_tag_t KM_TAG_PADDING = KM_ENUM_REP | 6;
inline constexpr keymaster_tag_t KM_TAG_CALLER_NONCE = KM_BOOL | 7;
inline constexpr keymaster_tag_t KM_TAG_MIN_MAC_LENGTH = KM_UINT | 8;
inline constexpr keymaster_tag_t KM_TAG_RSA_PUBLIC_EXPONENT = KM_ULONG | 200;
inline constexpr keymaster_tag_t KM_TAG_BLOB_USAGE_REQUIREMENTS = KM_ENUM | 301;
inline constexpr keymaster_tag_t KM_TAG_BOOTLOADER_ONLY = KM_BOOL | 302;
inline constexpr keymaster_tag_t KM_TAG_ACTIVE_DATETIME = KM_DATE | 400;
inline constexpr keymaster_tag_t KM_TAG_ORIGINATION_EXPIRE_DATETIME = KM_DATE | 401;
inline constexpr keymaster_tag_t KM_TAG_USAGE_EXPIRE_DATETIME = KM_DATE | 402;
inline constexpr keymaster_tag_t KM_TAG_MIN_SECONDS_BETWEEN_OPS = KM_UINT | 403;
inline constexpr keymaster_tag_t KM_TAG_MAX_USES_PER_BOOT = KM_UINT | 404;
inline constexpr keymaster_tag_t KM_TAG_USER_SECURE_ID = KM_ULONG_REP | 502;
inline constexpr keymaster_tag_t KM_TAG_NO_AUTH_REQUIRED = KM_BOOL | 503;
inline constexpr keymaster_tag_t KM_TAG_USER_AUTH_TYPE = KM_ENUM | 504;
inline constexpr keymaster_tag_t KM_TAG_AUTH_TIMEOUT = KM_UINT | 505;
inline constexpr keymaster_tag_t KM_TAG_APPLICATION_ID = KM_BYTES | 601;
inline constexpr keymaster_tag_t KM_TAG_APPLICATION_DATA = KM_BYTES | 700;
inline constexpr keymaster_tag_t KM_TAG_ORIGIN = KM_ENUM | 702;
inline constexpr keymaster_tag_t KM_TAG_ROOT_OF_TRUST = KM_BYTES | 704;
inline constexpr keymaster_tag_t KM_TAG_ASSOCIATED_DATA = KM_BYTES | 1000;
inline constexpr keymaster_tag_t KM_TAG_NONCE = KM_BYTES | 1001;
inline constexpr keymaster_tag_t KM_TAG_AUTH_TOKEN = KM_BYTES | 1002;
inline constexpr keymaster_tag_t KM_TAG_MAC_LENGTH = KM_UINT | 1003;
/// A tag of this system's own: the key belongs to the soter attestation framework. Its presence counts, not its value.
inline constexpr keymaster_tag_t KM_TAG_SOTER_KEY = KM_BOOL | 11000;
/// What goes with it. The export statement of the key is signed by the device's attestation key, or else by a key whose
/// blob is given; the statement tells the counter, and the uid that the key was made for.
inline constexpr keymaster_tag_t KM_TAG_SOTER_SIGNED_BY_ATTK = KM_BOOL | 11001;
inline constexpr keymaster_tag_t KM_TAG_SOTER_SIGNED_BY_KEY = KM_BOOL | 11002;
/// The signing key's blob where KM_TAG_SOTER_SIGNING_KEY_BLOB is absent, although it is called a name.
inline constexpr keymaster_tag_t KM_TAG_SOTER_SIGNING_KEY_NAME = KM_BYTES | 11003;
inline constexpr keymaster_tag_t KM_TAG_SOTER_COUNTED = KM_BOOL | 11004;
inline constexpr keymaster_tag_t KM_TAG_SOTER_UID = KM_UINT | 11007;
inline constexpr keymaster_tag_t KM_TAG_SOTER_SIGNING_KEY_BLOB = KM_BYTES | 11008;
static_assert(KM_TAG_SOTER_KEY == 0x70002AF8 && KM_TAG_SOTER_SIGNED_BY_ATTK == 0x70002AF9 &&
              KM_TAG_SOTER_SIGNED_BY_KEY == 0x70002AFA && KM_TAG_SOTER_SIGNING_KEY_NAME == 0x90002AFB &&
              KM_TAG_SOTER_COUNTED == 0x70002AFC && KM_TAG_SOTER_UID == 0x30002AFF &&
              KM_TAG_SOTER_SIGNING_KEY_BLOB == 0x90002B00);

enum keymaster_algorithm_t : uint32_t {
  KM_ALGORITHM_RSA = 1,
  KM_ALGORITHM_EC = 3,
  KM_ALGORITHM_AES = 32,
  KM_ALGORITHM_HMAC = 128,
};

enum keymaster_purpose_t : uint32_t {
  KM_PURPOSE_ENCRYPT = 0,
  KM_PURPOSE_DECRYPT = 1,
  KM_PURPOSE_SIGN = 2,
  KM_PURPOSE_VERIFY = 3,
};

enum keymaster_block_mode_t : uint32_t {
  KM_MODE_ECB = 1,
  KM_MODE_CBC = 2,
  KM_MODE_CTR = 3,
  KM_MODE_GCM = 32,
};

enum keymaster_padding_t : uint32_t {
  KM_PAD_NONE = 1,
  KM_PAD_RSA_OAEP = 2,
  KM_PAD_RSA_PSS = 3,
  KM_PAD_RSA_PKCS1_1_5_ENCRYPT = 4,
  KM_PAD_RSA_PKCS1_1_5_SIGN = 5,
  KM_PAD_PKCS7 = 64,
};

enum keymaster_digest_t : uint32_t {
  KM_DIGEST_NONE = 0,
  KM_DIGEST_MD5 = 1,
  KM_DIGEST_SHA1 = 2,
  KM_DIGEST_SHA_2_224 = 3,
  KM_DIGEST_SHA_2_256 = 4,
  KM_DIGEST_SHA_2_384 = 5,
  KM_DIGEST_SHA_2_512 = 6,
};

enum keymaster_key_origin_t : uint32_t {
  KM_ORIGIN_GENERATED = 0,
  KM_ORIGIN_IMPORTED = 2,
};

enum keymaster_key_format_t : uint32_t {
  KM_KEY_FORMAT_X509 = 0,   ///< export
  KM_KEY_FORMAT_PKCS8 = 1,  ///< import
  KM_KEY_FORMAT_RAW = 3,    ///< import
};

/// Error codes of the public definitions that the system answers.
enum keymaster_error_t : int32_t {
  KM_ERROR_OK = 0,
  KM_ERROR_UNSUPPORTED_PURPOSE = -2,
  KM_ERROR_INCOMPATIBLE_PURPOSE = -3,
  KM_ERROR_UNSUPPORTED_ALGORITHM = -4,
  KM_ERROR_UNSUPPORTED_KEY_SIZE = -6,
  KM_ERROR_UNSUPPORTED_BLOCK_MODE = -7,
  KM_ERROR_INCOMPATIBLE_BLOCK_MODE = -8,
  KM_ERROR_UNSUPPORTED_MAC_LENGTH = -9,
  KM_ERROR_UNSUPPORTED_PADDING_MODE = -10,
  KM_ERROR_INCOMPATIBLE_PADDING_MODE = -11,
  KM_ERROR_UNSUPPORTED_DIGEST = -12,
  KM_ERROR_INCOMPATIBLE_DIGEST = -13,
  KM_ERROR_UNSUPPORTED_KEY_FORMAT = -17,
  KM_ERROR_INVALID_INPUT_LENGTH = -21,
  KM_ERROR_KEY_NOT_YET_VALID = -24,
  KM_ERROR_KEY_EXPIRED = -25,
  KM_ERROR_KEY_USER_NOT_AUTHENTICATED = -26,
  KM_ERROR_INVALID_OPERATION_HANDLE = -28,
  KM_ERROR_INSUFFICIENT_BUFFER_SPACE = -29,
  KM_ERROR_VERIFICATION_FAILED = -30,
  KM_ERROR_TOO_MANY_OPERATIONS = -31,
  KM_ERROR_INVALID_KEY_BLOB = -33,
  KM_ERROR_INVALID_ARGUMENT = -38,
  KM_ERROR_INVALID_TAG = -40,
  KM_ERROR_MEMORY_ALLOCATION_FAILED = -41,
  KM_ERROR_IMPORT_PARAMETER_MISMATCH = -44,
  KM_ERROR_KEY_RATE_LIMIT_EXCEEDED = -54,
  KM_ERROR_CALLER_NONCE_PROHIBITED = -55,
  KM_ERROR_KEY_MAX_OPS_EXCEEDED = -56,
  KM_ERROR_INVALID_MAC_LENGTH = -57,
  KM_ERROR_MISSING_MIN_MAC_LENGTH = -58,
  KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH = -59,
  KM_ERROR_UNIMPLEMENTED = -100,
  KM_ERROR_UNKNOWN_ERROR = -1000,
};

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_KEYMASTER_DEFS_H_
