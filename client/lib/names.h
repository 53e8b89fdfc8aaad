// The public names of the protocol's numbers: commands, tags, enumerations, errors and results.
#ifndef KEYMASTER_CLIENT_LIB_NAMES_H_
#define KEYMASTER_CLIENT_LIB_NAMES_H_

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "src/params/keymaster_defs.h"

namespace keymaster::client {

struct named_value {
  std::uint32_t value;
  std::string_view name;
};
using name_table = std::span<const named_value>;

// The enumerations, in the words that people type: "rsa", "sha-256", "pkcs1-1-5-sign", …
extern const name_table algorithm_names;
extern const name_table purpose_names;
extern const name_table block_mode_names;
extern const name_table padding_names;
extern const name_table digest_names;
extern const name_table origin_names;
extern const name_table key_format_names;
extern const name_table auth_type_names;

/// A tag: its number, its word ("key-size"), and the table of its values when it is an enumeration.
struct tag_name {
  keymaster_tag_t tag;
  std::string_view name;
  name_table values;
};
extern const std::span<const tag_name> tag_names;

/// find_tag gives the row of a tag, or null for one without a name.
[[nodiscard]] const tag_name* find_tag(keymaster_tag_t tag);

/// name_of gives the word of a value, or the number in decimal when the table does not have it.
[[nodiscard]] std::string name_of(name_table table, std::uint64_t value);

/// value_of gives the value that a word stands for, or nothing.
[[nodiscard]] std::optional<std::uint32_t> value_of(name_table table, std::string_view name);

/// keymaster_error_name: "KM_ERROR_INVALID_KEY_BLOB", or "KM_ERROR(-7777)" for a number without a name.
[[nodiscard]] std::string keymaster_error_name(std::int32_t error);

/// soter_status_name: "SOTER_STATUS_NO_ATTK", and else the name of the Keymaster error.
[[nodiscard]] std::string soter_status_name(std::int32_t status);

/// tee_result_name: "TEE_ERROR_MAC_INVALID", or "TEE_Result(0x12345678)". The TA's own two results are
/// KSK_ERROR_DELETED and KSK_ERROR_RPMB_GONE; they share their numbers with two results of the platform's storage that
/// never reach a client.
[[nodiscard]] std::string tee_result_name(std::uint32_t result);

/// tee_origin_name tells which layer a result comes from: "API", "COMMS", "TEE", "TRUSTED_APP".
[[nodiscard]] std::string tee_origin_name(std::uint32_t origin);

/// command_name gives a command's name as the protocol's description has it: "generate_key", "begin", …
[[nodiscard]] std::string command_name(std::uint32_t command);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_NAMES_H_
