#include "client/kmctl/authorization_options.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <string_view>
#include <vector>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/values.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

using namespace keymaster;
using client::authorizations;

enum class value_kind { name, names, number, numbers, date, flag, file };

constexpr unsigned for_keys = static_cast<unsigned>(option_use::generate) | static_cast<unsigned>(option_use::import);
constexpr unsigned for_operations = static_cast<unsigned>(option_use::operation);

constexpr const char* group_kind = "Kind of key";
constexpr const char* group_use = "What it may be used for";
constexpr const char* group_when = "When and how often (a boot lasts as long as the secure world runs)";
constexpr const char* group_who = "Who may use it";
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
    {"--digest", KM_TAG_DIGEST, value_kind::name, for_operations, group_operation, "digest"},
    {"--padding", KM_TAG_PADDING, value_kind::name, for_operations, group_operation, "padding"},
    {"--mac-length", KM_TAG_MAC_LENGTH, value_kind::number, for_operations, group_operation, "MAC length in bits"},
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

void add_row(CLI::App& command, const option_row& row, authorizations& out) {
  if (row.kind == value_kind::flag) {
    command
        .add_flag_callback(
            row.flag, [&row, &out] { add_value(out, row, {}); }, row.help)
        ->group(row.group);
    return;
  }
  auto* const option = command.add_option_function<std::string>(
      row.flag, [&row, &out](const std::string& text) { add_values(out, row, text); }, help_of(row));
  option->type_name(placeholder(row.kind))->group(row.group);
  if (is_list(row.kind)) {
    option->join(',');  // an option that is given again goes on with its list
  }
}

/// A new key of each algorithm, as far as its maker does not say otherwise.
struct default_row {
  keymaster_algorithm_t algorithm;
  authorizations (*size)();
  authorizations (*use)();
};

constexpr std::array default_rows = std::to_array<default_row>({
    {KM_ALGORITHM_RSA, [] { return authorizations{}.key_size(2048).rsa_public_exponent(65537); },
     [] {
       return authorizations{}
           .purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY})
           .digest({KM_DIGEST_SHA_2_256})
           .padding({KM_PAD_RSA_PKCS1_1_5_SIGN});
     }},
    {KM_ALGORITHM_EC, [] { return authorizations{}.key_size(256); },
     [] {
       return authorizations{}.purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}).digest({KM_DIGEST_SHA_2_256});
     }},
    {KM_ALGORITHM_AES, [] { return authorizations{}.key_size(256); },
     [] {
       return authorizations{}
           .purpose({KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT})
           .block_mode({KM_MODE_GCM})
           .padding({KM_PAD_NONE})
           .min_mac_length(128);
     }},
    {KM_ALGORITHM_HMAC, [] { return authorizations{}.key_size(256); },
     [] {
       return authorizations{}
           .purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY})
           .digest({KM_DIGEST_SHA_2_256})
           .min_mac_length(256);
     }},
});

void add_missing(authorizations& to, const authorizations& given, const authorizations& defaults) {
  for (const client::authorization& one : defaults) {
    if (!given.contains(one.tag)) {
      to.add(one.tag, one.number);
    }
  }
}

/// What begin must be told for a key of each algorithm, and the values that count for a signature.
struct choice_row {
  keymaster_algorithm_t algorithm;
  keymaster_tag_t tag;
  std::array<std::uint32_t, 3> candidates;  ///< all zero: any value
};
constexpr std::array choice_rows = std::to_array<choice_row>({
    {KM_ALGORITHM_RSA, KM_TAG_PADDING, {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN}},
    {KM_ALGORITHM_RSA, KM_TAG_DIGEST, {}},
    {KM_ALGORITHM_EC, KM_TAG_DIGEST, {}},
});

std::uint64_t only_choice(const choice_row& row, const authorizations& characteristics) {
  std::vector<std::uint64_t> left;
  for (const std::uint64_t value : characteristics.numbers(row.tag)) {
    const bool counts = row.candidates == std::array<std::uint32_t, 3>{} ||
                        std::ranges::find(row.candidates, value) != row.candidates.end();
    if (counts && std::ranges::find(left, value) == left.end()) {
      left.push_back(value);
    }
  }
  if (left.size() == 1) {
    return left.front();
  }
  const client::tag_name* const tag = client::find_tag(row.tag);
  std::string choices;
  for (const std::uint64_t value : left) {
    choices += (choices.empty() ? "" : ", ") + client::name_of(tag->values, value);
  }
  throw usage_error(left.empty() ? fmt::format("the key names no {} that could be used", tag->name)
                                 : fmt::format("the key allows more than one {}: {}", tag->name, choices),
                    fmt::format("say which one with --{}", tag->name));
}

}  // namespace

void authorization_options::add_to(CLI::App& command, option_use use) {
  for (const option_row& row : option_rows) {
    if ((row.uses & static_cast<unsigned>(use)) != 0) {
      add_row(command, row, given_);
    }
  }
}

void application_options::add_to(CLI::App& command) {
  constexpr const char* group = "Application";
  const auto add = [&](const char* flag, bytes& to, const char* help) {
    command
        .add_option_function<std::string>(
            flag, [&to](const std::string& text) { to = parse_bytes(text); }, help)
        ->type_name("VALUE")
        ->group(group);
  };
  add("--app-id", given_.id, "application id the key is bound to: text, hex:00ff17 or @FILE");
  add("--app-data", given_.data, "application data the key is bound to, in the same forms");
}

authorizations with_defaults(const authorizations& given, option_use use) {
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
    // Raw RSA works on what the caller prepared; a digest would make such a key unusable.
    const bool raw = given.unique_number(KM_TAG_PADDING) == KM_PAD_NONE && algorithm == KM_ALGORITHM_RSA;
    if (raw && !given.contains(KM_TAG_DIGEST)) {
      all.digest({KM_DIGEST_NONE});
    }
    add_missing(all, authorizations(all), row->use());
  }
  if (!given.contains(KM_TAG_USER_SECURE_ID) && !given.contains(KM_TAG_NO_AUTH_REQUIRED)) {
    all.no_auth_required();
  }
  return all;
}

authorizations operation_parameters(const authorizations& given, const authorizations& characteristics) {
  authorizations all = given;
  const auto algorithm = characteristics.unique_number(KM_TAG_ALGORITHM);
  for (const choice_row& row : choice_rows) {
    if (row.algorithm != algorithm || all.contains(row.tag)) {
      continue;
    }
    const bool raw = row.tag == KM_TAG_DIGEST && all.unique_number(KM_TAG_PADDING) == KM_PAD_NONE;
    all.add(row.tag, raw ? std::uint64_t{KM_DIGEST_NONE} : only_choice(row, characteristics));
  }
  if (algorithm == KM_ALGORITHM_HMAC && !all.contains(KM_TAG_MAC_LENGTH)) {
    if (const auto shortest = characteristics.unique_number(KM_TAG_MIN_MAC_LENGTH)) {
      all.add(KM_TAG_MAC_LENGTH, *shortest);
    }
  }
  return all;
}

}  // namespace kmctl
