#include "client/kmctl/authorization_options.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <string_view>
#include <vector>

#include "client/kmctl/attested_key.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/operation_parameters.h"
#include "client/kmctl/values.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

using namespace keymaster;
using client::authorizations;

enum class value_kind { name, names, number, numbers, date, flag, file };

constexpr unsigned for_new_keys = static_cast<unsigned>(option_use::generate);
constexpr unsigned for_keys = static_cast<unsigned>(option_use::generate) | static_cast<unsigned>(option_use::import);
constexpr unsigned for_ciphers = static_cast<unsigned>(option_use::cipher);
constexpr unsigned for_operations = static_cast<unsigned>(option_use::operation) | for_ciphers;

constexpr const char* group_kind = "Kind of key";
constexpr const char* group_use = "What it may be used for";
constexpr const char* group_when = "When and how often (a boot lasts as long as the secure world runs)";
constexpr const char* group_who = "Who may use it";
constexpr const char* group_attested =
    "Attested keys (generated ones only: the TA can't vouch for what was known outside)";
constexpr const char* group_operation = "Operation";

struct option_row {
  const char* flag;
  keymaster_tag_t tag;
  value_kind kind;
  unsigned uses;
  const char* group;
  const char* help;
};

constexpr std::array option_rows = std::to_array<option_row>({
    {"--algorithm", KM_TAG_ALGORITHM, value_kind::name, for_keys, group_kind, "algorithm"},
    {"--size", KM_TAG_KEY_SIZE, value_kind::number, for_keys, group_kind, "key size in bits"},
    {"--exponent", KM_TAG_RSA_PUBLIC_EXPONENT, value_kind::number, for_keys, group_kind, "RSA public exponent"},
    {"--purpose", KM_TAG_PURPOSE, value_kind::names, for_keys, group_use, "purposes"},
    {"--digest", KM_TAG_DIGEST, value_kind::names, for_keys, group_use, "digests"},
    {"--padding", KM_TAG_PADDING, value_kind::names, for_keys, group_use, "paddings"},
    {"--block-mode", KM_TAG_BLOCK_MODE, value_kind::names, for_keys, group_use, "block modes"},
    {"--caller-nonce", KM_TAG_CALLER_NONCE, value_kind::flag, for_keys, group_use, "the user may choose the nonce"},
    {"--min-mac-length", KM_TAG_MIN_MAC_LENGTH, value_kind::number, for_keys, group_use, "shortest MAC, in bits"},
    {"--active", KM_TAG_ACTIVE_DATETIME, value_kind::date, for_keys, group_when, "not valid before this date"},
    {"--origination-expire", KM_TAG_ORIGINATION_EXPIRE_DATETIME, value_kind::date, for_keys, group_when,
     "no signing or encrypting after this date"},
    {"--usage-expire", KM_TAG_USAGE_EXPIRE_DATETIME, value_kind::date, for_keys, group_when,
     "no decrypting or MAC checking after this date"},
    {"--max-uses-per-boot", KM_TAG_MAX_USES_PER_BOOT, value_kind::number, for_keys, group_when, "uses per boot"},
    {"--min-seconds-between-ops", KM_TAG_MIN_SECONDS_BETWEEN_OPS, value_kind::number, for_keys, group_when,
     "seconds between two uses"},
    {"--bootloader-only", KM_TAG_BOOTLOADER_ONLY, value_kind::flag, for_keys, group_when,
     "usable by the boot loader only"},
    {"--no-auth-required", KM_TAG_NO_AUTH_REQUIRED, value_kind::flag, for_keys, group_who,
     "no user authentication (the default without --user-secure-id)"},
    {"--user-secure-id", KM_TAG_USER_SECURE_ID, value_kind::numbers, for_keys, group_who,
     "ids of users who must authenticate"},
    {"--user-auth-type", KM_TAG_USER_AUTH_TYPE, value_kind::name, for_keys, group_who, "how the user authenticates"},
    {"--auth-timeout", KM_TAG_AUTH_TIMEOUT, value_kind::number, for_keys, group_who,
     "seconds that an authentication lasts (default: one operation)"},
    {"--soter", KM_TAG_SOTER_KEY, value_kind::flag, for_new_keys, group_attested,
     "the key signs statements, and its own statement is signed"},
    {"--signed-by-attk", KM_TAG_SOTER_SIGNED_BY_ATTK, value_kind::flag, for_new_keys, group_attested,
     "by the device's attestation key (the default)"},
    {"--signed-by", KM_TAG_SOTER_SIGNING_KEY_BLOB, value_kind::file, for_new_keys, group_attested,
     "by the RSA-2048 key of this blob"},
    {"--counted", KM_TAG_SOTER_COUNTED, value_kind::flag, for_new_keys, group_attested,
     "the key's statement tells the device's counter"},
    {"--uid", KM_TAG_SOTER_UID, value_kind::number, for_new_keys, group_attested, "the user that the key is made for"},
    {"--block-mode", KM_TAG_BLOCK_MODE, value_kind::name, for_ciphers, group_operation, "block mode"},
    {"--padding", KM_TAG_PADDING, value_kind::name, for_operations, group_operation, "padding"},
    {"--digest", KM_TAG_DIGEST, value_kind::name, for_operations, group_operation, "digest"},
    {"--mac-length", KM_TAG_MAC_LENGTH, value_kind::number, for_operations, group_operation,
     "bits of a MAC or a GCM tag (default: all of them)"},
    {"--auth-token", KM_TAG_AUTH_TOKEN, value_kind::file, for_operations, group_operation,
     "file with the user's auth token"},
});

std::uint64_t largest_of(keymaster_tag_t tag) {
  const auto type = client::tag_type(tag);
  return type == KM_ULONG || type == KM_ULONG_REP ? UINT64_MAX : UINT32_MAX;
}

bool is_list(value_kind kind) {
  return kind == value_kind::names || kind == value_kind::numbers;
}

const char* placeholder(value_kind kind) {
  switch (kind) {
    case value_kind::name:
      return "NAME";
    case value_kind::names:
      return "NAME,...";
    case value_kind::number:
      return "NUMBER";
    case value_kind::numbers:
      return "NUMBER,...";
    case value_kind::date:
      return "DATE";
    default:
      return "FILE";
  }
}

void add_value(authorizations& out, const option_row& row, const std::string& text) {
  switch (row.kind) {
    case value_kind::name:
    case value_kind::names:
      out.add(row.tag, std::uint64_t{parse_name(client::find_tag(row.tag)->values, row.flag + 2, text)});
      break;
    case value_kind::number:
    case value_kind::numbers:
      out.add(row.tag, parse_number(text, largest_of(row.tag)));
      break;
    case value_kind::date:
      out.add(row.tag, static_cast<std::uint64_t>(parse_date(text).time_since_epoch().count()));
      break;
    case value_kind::flag:
      out.add(row.tag, std::uint64_t{1});
      break;
    case value_kind::file:
      out.add(row.tag, read_small_file(text, row.flag + 2));
      break;
  }
}

std::string help_of(const option_row& row) {
  const bool named = row.kind == value_kind::name || row.kind == value_kind::names;
  return named ? fmt::format("{}: {}", row.help, list_names(client::find_tag(row.tag)->values)) : row.help;
}

/// Adds a value, or each value of a list like `sha-256,none`.
void add_values(authorizations& out, const option_row& row, std::string_view text) {
  while (is_list(row.kind) && text.find(',') != std::string_view::npos) {
    add_value(out, row, std::string(text.substr(0, text.find(','))));
    text.remove_prefix(text.find(',') + 1);
  }
  add_value(out, row, std::string(text));
}

void add_row(command_line& command, const option_row& row, authorizations& out, std::vector<std::string>& files) {
  if (row.kind == value_kind::flag) {
    command
        .add_flag_callback(
            row.flag, [&row, &out] { add_value(out, row, {}); }, row.help)
        .group(row.group);
    return;
  }
  const option made = command.add_option_function(
      row.flag,
      [&row, &out, &files](const std::string& text) {
        if (row.kind == value_kind::file) {
          files.push_back(text);
        }
        add_values(out, row, text);
      },
      help_of(row));
  made.type_name(placeholder(row.kind)).group(row.group);
  if (is_list(row.kind)) {
    made.join(',');  // an option that is given again goes on with its list
  }
}

/// A new key of each algorithm, as far as its maker does not say otherwise: first its size, then what goes with what
/// is known of its use.
struct default_row {
  keymaster_algorithm_t algorithm;
  authorizations (*size)();
  authorizations (*use)(const authorizations& given);
};

bool names_any(const authorizations& list, keymaster_tag_t tag, std::initializer_list<std::uint64_t> values) {
  return std::ranges::any_of(list.numbers(tag),
                             [&](std::uint64_t one) { return std::ranges::count(values, one) != 0; });
}

/// An RSA key signs, unless its purposes or its paddings say that it encrypts, or that it does both.
authorizations rsa_use(const authorizations& given) {
  const bool told = given.contains(KM_TAG_PURPOSE);
  const bool pads_texts = names_any(given, KM_TAG_PADDING, {KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT});
  const bool pads_signatures =
      names_any(given, KM_TAG_PADDING, {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN});
  const bool signs =
      told ? names_any(given, KM_TAG_PURPOSE, {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) : pads_signatures || !pads_texts;
  const bool encrypts = told ? names_any(given, KM_TAG_PURPOSE, {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}) : pads_texts;
  authorizations use;
  if (signs) {
    use.purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY});
  }
  if (encrypts) {
    use.purpose({KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT});
  }
  // Without a padding, and with this one, there is nothing to digest: a digest would make such a key unusable.
  const std::uint64_t padding = given.unique_number(KM_TAG_PADDING).value_or(KM_PAD_RSA_OAEP);
  const bool bare = padding == KM_PAD_NONE || padding == KM_PAD_RSA_PKCS1_1_5_ENCRYPT;
  use.digest({bare ? KM_DIGEST_NONE : KM_DIGEST_SHA_2_256});
  if (signs) {
    use.padding({KM_PAD_RSA_PKCS1_1_5_SIGN});
  }
  if (encrypts) {
    use.padding({KM_PAD_RSA_OAEP});
  }
  return use;
}

authorizations ec_use(const authorizations& /*given*/) {
  return authorizations{}.purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}).digest({KM_DIGEST_SHA_2_256});
}

/// The paddings follow the block modes: a text of any length must have a way through each of them.
authorizations aes_use(const authorizations& given) {
  const bool chosen = given.contains(KM_TAG_BLOCK_MODE);
  const bool gcm = !chosen || names_any(given, KM_TAG_BLOCK_MODE, {KM_MODE_GCM});
  authorizations use = authorizations{}.purpose({KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}).block_mode({KM_MODE_GCM});
  if (gcm || names_any(given, KM_TAG_BLOCK_MODE, {KM_MODE_CTR})) {
    use.padding({KM_PAD_NONE});
  }
  if (names_any(given, KM_TAG_BLOCK_MODE, {KM_MODE_ECB, KM_MODE_CBC})) {
    use.padding({KM_PAD_PKCS7});
  }
  return gcm ? use.min_mac_length(128) : use;
}

/// A MAC is as long as its digest.
authorizations hmac_use(const authorizations& given) {
  const std::uint64_t digest = given.unique_number(KM_TAG_DIGEST).value_or(KM_DIGEST_SHA_2_256);
  return authorizations{}
      .purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY})
      .digest({KM_DIGEST_SHA_2_256})
      .min_mac_length(digest_bits(digest));
}

constexpr std::array default_rows = std::to_array<default_row>({
    {KM_ALGORITHM_RSA, [] { return authorizations{}.key_size(2048).rsa_public_exponent(65537); }, rsa_use},
    {KM_ALGORITHM_EC, [] { return authorizations{}.key_size(256); }, ec_use},
    {KM_ALGORITHM_AES, [] { return authorizations{}.key_size(256); }, aes_use},
    {KM_ALGORITHM_HMAC, [] { return authorizations{}.key_size(256); }, hmac_use},
});

void add_missing(authorizations& to, const authorizations& given, const authorizations& defaults) {
  for (const client::authorization& one : defaults) {
    if (!given.contains(one.tag)) {
      to.add(one.tag, one.number);
    }
  }
}

}  // namespace

void authorization_options::add_to(command_line& command, option_use use) {
  for (const option_row& row : option_rows) {
    if ((row.uses & static_cast<unsigned>(use)) != 0) {
      add_row(command, row, given_, files_);
    }
  }
}

void application_options::add_to(command_line& command) {
  constexpr const char* group = "Application";
  const auto add = [&](const char* flag, bytes& to, const char* help) {
    command
        .add_option_function(
            flag,
            [this, &to](const std::string& text) {
              if (const auto file = file_of_value(text)) {
                files_.push_back(*file);
              }
              to = parse_bytes(text);
            },
            help)
        .type_name("VALUE")
        .group(group);
  };
  add("--app-id", given_.id, "application id the key is bound to: text, hex:00ff17 or @FILE");
  add("--app-data", given_.data, "application data the key is bound to, in the same forms");
}

authorizations with_defaults(const authorizations& stated, option_use use) {
  const authorizations given = attested_description(stated);
  authorizations all;
  const std::uint64_t algorithm = given.unique_number(KM_TAG_ALGORITHM).value_or(KM_ALGORITHM_RSA);
  if (!given.contains(KM_TAG_ALGORITHM)) {
    all.add(KM_TAG_ALGORITHM, algorithm);
  }
  all.add(given);
  const auto row = std::ranges::find(default_rows, algorithm, &default_row::algorithm);
  if (row != default_rows.end()) {
    if (use == option_use::generate) {
      add_missing(all, given, row->size());
    }
    add_missing(all, given, row->use(given));
  }
  if (!given.contains(KM_TAG_USER_SECURE_ID) && !given.contains(KM_TAG_NO_AUTH_REQUIRED)) {
    all.no_auth_required();
  }
  return all;
}

}  // namespace kmctl
