#include "client/lib/names.h"

#include <algorithm>
#include <array>

#include "src/params/keymaster_protocol.h"
#include "tee_client_api.h"

namespace keymaster::client {
namespace {

constexpr std::array algorithms = std::to_array<named_value>(
    {{KM_ALGORITHM_RSA, "rsa"}, {KM_ALGORITHM_EC, "ec"}, {KM_ALGORITHM_AES, "aes"}, {KM_ALGORITHM_HMAC, "hmac"}});

constexpr std::array purposes = std::to_array<named_value>({{KM_PURPOSE_ENCRYPT, "encrypt"},
                                                            {KM_PURPOSE_DECRYPT, "decrypt"},
                                                            {KM_PURPOSE_SIGN, "sign"},
                                                            {KM_PURPOSE_VERIFY, "verify"}});

constexpr std::array block_modes = std::to_array<named_value>(
    {{KM_MODE_ECB, "ecb"}, {KM_MODE_CBC, "cbc"}, {KM_MODE_CTR, "ctr"}, {KM_MODE_GCM, "gcm"}});

constexpr std::array paddings = std::to_array<named_value>({{KM_PAD_NONE, "none"},
                                                            {KM_PAD_RSA_OAEP, "oaep"},
                                                            {KM_PAD_RSA_PSS, "pss"},
                                                            {KM_PAD_RSA_PKCS1_1_5_ENCRYPT, "pkcs1-1-5-encrypt"},
                                                            {KM_PAD_RSA_PKCS1_1_5_SIGN, "pkcs1-1-5-sign"},
                                                            {KM_PAD_PKCS7, "pkcs7"}});

constexpr std::array digests = std::to_array<named_value>({{KM_DIGEST_NONE, "none"},
                                                           {KM_DIGEST_MD5, "md5"},
                                                           {KM_DIGEST_SHA1, "sha-1"},
                                                           {KM_DIGEST_SHA_2_224, "sha-224"},
                                                           {KM_DIGEST_SHA_2_256, "sha-256"},
                                                           {KM_DIGEST_SHA_2_384, "sha-384"},
                                                           {KM_DIGEST_SHA_2_512, "sha-512"}});

constexpr std::array origins =
    std::to_array<named_value>({{KM_ORIGIN_GENERATED, "generated"}, {KM_ORIGIN_IMPORTED, "imported"}});

constexpr std::array key_formats = std::to_array<named_value>(
    {{KM_KEY_FORMAT_X509, "x509"}, {KM_KEY_FORMAT_PKCS8, "pkcs8"}, {KM_KEY_FORMAT_RAW, "raw"}});

constexpr std::array auth_types = std::to_array<named_value>(
    {{1, "password"}, {2, "fingerprint"}, {3, "password-or-fingerprint"}, {UINT32_MAX, "any"}});

constexpr std::array tags = std::to_array<tag_name>({
    {KM_TAG_ALGORITHM, "algorithm", algorithms},
    {KM_TAG_KEY_SIZE, "key-size", {}},
    {KM_TAG_RSA_PUBLIC_EXPONENT, "rsa-public-exponent", {}},
    {KM_TAG_PURPOSE, "purpose", purposes},
    {KM_TAG_DIGEST, "digest", digests},
    {KM_TAG_PADDING, "padding", paddings},
    {KM_TAG_BLOCK_MODE, "block-mode", block_modes},
    {KM_TAG_CALLER_NONCE, "caller-nonce", {}},
    {KM_TAG_MIN_MAC_LENGTH, "min-mac-length", {}},
    {KM_TAG_MAC_LENGTH, "mac-length", {}},
    {KM_TAG_BLOB_USAGE_REQUIREMENTS, "blob-usage-requirements", {}},
    {KM_TAG_BOOTLOADER_ONLY, "bootloader-only", {}},
    {KM_TAG_ACTIVE_DATETIME, "active-datetime", {}},
    {KM_TAG_ORIGINATION_EXPIRE_DATETIME, "origination-expire-datetime", {}},
    {KM_TAG_USAGE_EXPIRE_DATETIME, "usage-expire-datetime", {}},
    {KM_TAG_MIN_SECONDS_BETWEEN_OPS, "min-seconds-between-ops", {}},
    {KM_TAG_MAX_USES_PER_BOOT, "max-uses-per-boot", {}},
    {KM_TAG_NO_AUTH_REQUIRED, "no-auth-required", {}},
    {KM_TAG_USER_SECURE_ID, "user-secure-id", {}},
    {KM_TAG_USER_AUTH_TYPE, "user-auth-type", auth_types},
    {KM_TAG_AUTH_TIMEOUT, "auth-timeout", {}},
    {KM_TAG_AUTH_TOKEN, "auth-token", {}},
    {KM_TAG_APPLICATION_ID, "application-id", {}},
    {KM_TAG_APPLICATION_DATA, "application-data", {}},
    {KM_TAG_ORIGIN, "origin", origins},
    {KM_TAG_ROOT_OF_TRUST, "root-of-trust", {}},
    {KM_TAG_ASSOCIATED_DATA, "associated-data", {}},
    {KM_TAG_NONCE, "nonce", {}},
    {KM_TAG_SOTER_KEY, "soter-key", {}},
    {KM_TAG_SOTER_SIGNED_BY_ATTK, "soter-signed-by-attk", {}},
    {KM_TAG_SOTER_SIGNED_BY_KEY, "soter-signed-by-key", {}},
    {KM_TAG_SOTER_SIGNING_KEY_NAME, "soter-signing-key-name", {}},
    {KM_TAG_SOTER_COUNTED, "soter-counted", {}},
    {KM_TAG_SOTER_UID, "soter-uid", {}},
    {KM_TAG_SOTER_SIGNING_KEY_BLOB, "soter-signing-key-blob", {}},
});

#define NAMED(constant) \
  { static_cast<std::uint32_t>(constant), #constant }

constexpr std::array keymaster_errors = std::to_array<named_value>({
    NAMED(KM_ERROR_OK),
    NAMED(KM_ERROR_UNSUPPORTED_PURPOSE),
    NAMED(KM_ERROR_INCOMPATIBLE_PURPOSE),
    NAMED(KM_ERROR_UNSUPPORTED_ALGORITHM),
    NAMED(KM_ERROR_UNSUPPORTED_KEY_SIZE),
    NAMED(KM_ERROR_UNSUPPORTED_BLOCK_MODE),
    NAMED(KM_ERROR_INCOMPATIBLE_BLOCK_MODE),
    NAMED(KM_ERROR_UNSUPPORTED_MAC_LENGTH),
    NAMED(KM_ERROR_UNSUPPORTED_PADDING_MODE),
    NAMED(KM_ERROR_INCOMPATIBLE_PADDING_MODE),
    NAMED(KM_ERROR_UNSUPPORTED_DIGEST),
    NAMED(KM_ERROR_INCOMPATIBLE_DIGEST),
    {static_cast<std::uint32_t>(-17), "KM_ERROR_UNSUPPORTED_KEY_FORMAT"},
    NAMED(KM_ERROR_INVALID_INPUT_LENGTH),
    NAMED(KM_ERROR_KEY_NOT_YET_VALID),
    NAMED(KM_ERROR_KEY_EXPIRED),
    NAMED(KM_ERROR_KEY_USER_NOT_AUTHENTICATED),
    NAMED(KM_ERROR_INVALID_OPERATION_HANDLE),
    NAMED(KM_ERROR_INSUFFICIENT_BUFFER_SPACE),
    NAMED(KM_ERROR_VERIFICATION_FAILED),
    NAMED(KM_ERROR_TOO_MANY_OPERATIONS),
    NAMED(KM_ERROR_INVALID_KEY_BLOB),
    NAMED(KM_ERROR_INVALID_ARGUMENT),
    NAMED(KM_ERROR_INVALID_TAG),
    NAMED(KM_ERROR_MEMORY_ALLOCATION_FAILED),
    NAMED(KM_ERROR_IMPORT_PARAMETER_MISMATCH),
    NAMED(KM_ERROR_KEY_RATE_LIMIT_EXCEEDED),
    NAMED(KM_ERROR_CALLER_NONCE_PROHIBITED),
    NAMED(KM_ERROR_KEY_MAX_OPS_EXCEEDED),
    NAMED(KM_ERROR_INVALID_MAC_LENGTH),
    {static_cast<std::uint32_t>(-58), "KM_ERROR_MISSING_MIN_MAC_LENGTH"},
    NAMED(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH),
    NAMED(KM_ERROR_UNIMPLEMENTED),
    NAMED(KM_ERROR_UNKNOWN_ERROR),
});

constexpr std::array soter_statuses = std::to_array<named_value>(
    {NAMED(SOTER_STATUS_OK), NAMED(SOTER_STATUS_NO_ATTK), NAMED(SOTER_STATUS_UNREADABLE_ATTK)});

#undef NAMED

constexpr std::array tee_results = std::to_array<named_value>({
    {0x00000000, "TEE_SUCCESS"},
    {0xF0100001, "KSK_ERROR_DELETED"},
    {0xF0100002, "TEE_ERROR_CORRUPT_OBJECT_2"},
    {0xF0100003, "KSK_ERROR_RPMB_GONE"},
    {0xF0100004, "TEE_ERROR_STORAGE_NOT_AVAILABLE_2"},
    {0xFFFF0000, "TEE_ERROR_GENERIC"},
    {0xFFFF0001, "TEE_ERROR_ACCESS_DENIED"},
    {0xFFFF0002, "TEE_ERROR_CANCEL"},
    {0xFFFF0003, "TEE_ERROR_ACCESS_CONFLICT"},
    {0xFFFF0004, "TEE_ERROR_EXCESS_DATA"},
    {0xFFFF0005, "TEE_ERROR_BAD_FORMAT"},
    {0xFFFF0006, "TEE_ERROR_BAD_PARAMETERS"},
    {0xFFFF0007, "TEE_ERROR_BAD_STATE"},
    {0xFFFF0008, "TEE_ERROR_ITEM_NOT_FOUND"},
    {0xFFFF0009, "TEE_ERROR_NOT_IMPLEMENTED"},
    {0xFFFF000A, "TEE_ERROR_NOT_SUPPORTED"},
    {0xFFFF000B, "TEE_ERROR_NO_DATA"},
    {0xFFFF000C, "TEE_ERROR_OUT_OF_MEMORY"},
    {0xFFFF000D, "TEE_ERROR_BUSY"},
    {0xFFFF000E, "TEE_ERROR_COMMUNICATION"},
    {0xFFFF000F, "TEE_ERROR_SECURITY"},
    {0xFFFF0010, "TEE_ERROR_SHORT_BUFFER"},
    {0xFFFF0011, "TEE_ERROR_EXTERNAL_CANCEL"},
    {0xFFFF300F, "TEE_ERROR_OVERFLOW"},
    {0xFFFF3024, "TEE_ERROR_TARGET_DEAD"},
    {0xFFFF3041, "TEE_ERROR_STORAGE_NO_SPACE"},
    {0xFFFF3071, "TEE_ERROR_MAC_INVALID"},
    {0xFFFF3072, "TEE_ERROR_SIGNATURE_INVALID"},
    {0xFFFF5000, "TEE_ERROR_TIME_NOT_SET"},
    {0xFFFF5001, "TEE_ERROR_TIME_NEEDS_RESET"},
});

constexpr std::array origins_of_results = std::to_array<named_value>({{TEEC_ORIGIN_API, "API"},
                                                                      {TEEC_ORIGIN_COMMS, "COMMS"},
                                                                      {TEEC_ORIGIN_TEE, "TEE"},
                                                                      {TEEC_ORIGIN_TRUSTED_APP, "TRUSTED_APP"}});

constexpr std::array commands = std::to_array<named_value>({
    {KM_COMMAND_GET_SUPPORT_ALGO_CNT, "get_support_algo_cnt"},
    {KM_COMMAND_GET_SUPPORT_ALGO, "get_support_algo"},
    {KM_COMMAND_GET_SUPPORT_BLK_MODE_CNT, "get_support_blk_mode_cnt"},
    {KM_COMMAND_GET_SUPPORT_BLK_MODE, "get_support_blk_mode"},
    {KM_COMMAND_GET_SUPPORT_PADDING_MODE_CNT, "get_support_padding_mode_cnt"},
    {KM_COMMAND_GET_SUPPORT_PADDING_MODE, "get_support_padding_mode"},
    {KM_COMMAND_GET_SUPPORT_DIGEST_CNT, "get_support_digest_cnt"},
    {KM_COMMAND_GET_SUPPORT_DIGEST, "get_support_digest"},
    {KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT_CNT, "get_support_import_format_cnt"},
    {KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT, "get_support_import_format"},
    {KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT_CNT, "get_support_export_format_cnt"},
    {KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT, "get_support_export_format"},
    {KM_COMMAND_GENERATE_KEY, "generate_key"},
    {KM_COMMAND_GET_KEY_CHARACTER_SIZE, "get_key_character_size"},
    {KM_COMMAND_GET_KEY_CHARACTER, "get_key_character"},
    {KM_COMMAND_BEGIN, "begin"},
    {KM_COMMAND_UPDATE, "update"},
    {KM_COMMAND_FINISH, "finish"},
    {KM_COMMAND_IMPORT_KEY, "import_key"},
    {KM_COMMAND_EXPORT_KEY, "export_key"},
    {KM_COMMAND_DELETE_KEY, "delete_key"},
    {KM_COMMAND_DELETE_ALL_KEY, "delete_all_key"},
    {KM_COMMAND_ABORT, "abort"},
    {KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR, "soter_generate_attk_key_pair"},
    {KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR, "soter_verify_attk_key_pair"},
    {KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, "soter_export_attk_public_key"},
    {KM_COMMAND_SOTER_GET_DEVICE_ID, "soter_get_device_id"},
    {KM_COMMAND_SOTER_SET_FID, "soter_set_fid"},
});

std::string name_or(name_table table, std::uint32_t value, const std::string& otherwise) {
  const auto row = std::ranges::find(table, value, &named_value::value);
  return row == table.end() ? otherwise : std::string(row->name);
}

std::string hexadecimal(std::uint32_t value) {
  std::string text = "0x00000000";
  for (std::size_t i = text.size(); value != 0; value >>= 4U) {
    text[--i] = "0123456789abcdef"[value & 0xFU];
  }
  return text;
}

}  // namespace

constinit const name_table algorithm_names = algorithms;
constinit const name_table purpose_names = purposes;
constinit const name_table block_mode_names = block_modes;
constinit const name_table padding_names = paddings;
constinit const name_table digest_names = digests;
constinit const name_table origin_names = origins;
constinit const name_table key_format_names = key_formats;
constinit const name_table auth_type_names = auth_types;
constinit const std::span<const tag_name> tag_names = tags;

const tag_name* find_tag(keymaster_tag_t tag) {
  const auto row = std::ranges::find(tag_names, tag, &tag_name::tag);
  return row == tag_names.end() ? nullptr : &*row;
}

std::string name_of(name_table table, std::uint64_t value) {
  const auto row = std::ranges::find(table, value, &named_value::value);
  return row == table.end() ? std::to_string(value) : std::string(row->name);
}

std::optional<std::uint32_t> value_of(name_table table, std::string_view name) {
  const auto row = std::ranges::find(table, name, &named_value::name);
  return row == table.end() ? std::nullopt : std::optional(row->value);
}

std::string keymaster_error_name(std::int32_t error) {
  return name_or(keymaster_errors, static_cast<std::uint32_t>(error), "KM_ERROR(" + std::to_string(error) + ")");
}

std::string soter_status_name(std::int32_t status) {
  return name_or(soter_statuses, static_cast<std::uint32_t>(status), keymaster_error_name(status));
}

std::string tee_result_name(std::uint32_t result) {
  return name_or(tee_results, result, "TEE_Result(" + hexadecimal(result) + ")");
}

std::string tee_origin_name(std::uint32_t origin) {
  return name_or(origins_of_results, origin, "origin(" + std::to_string(origin) + ")");
}

std::string command_name(std::uint32_t command) {
  return name_or(commands, command, "command(" + std::to_string(command) + ")");
}

}  // namespace keymaster::client
