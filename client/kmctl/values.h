// Values as people type them on the command line, and as they read them.
#ifndef KEYMASTER_CLIENT_KMCTL_VALUES_H_
#define KEYMASTER_CLIENT_KMCTL_VALUES_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "client/lib/authorizations.h"
#include "client/lib/bytes.h"
#include "client/lib/names.h"

namespace kmctl {

using keymaster::client::byte_view;
using keymaster::client::bytes;
using keymaster::client::date;

/// parse_hex reads pairs of hexadecimal digits. Throws usage_error.
[[nodiscard]] bytes parse_hex(std::string_view text);
[[nodiscard]] std::string to_hex(byte_view data);

/// parse_bytes reads a byte string: `hex:0A0B`, `@FILE` for a file's content, `text:…` for the rest as it stands, and
/// anything else as the text itself. Throws usage_error, or failure_error when the file can't be read.
[[nodiscard]] bytes parse_bytes(const std::string& text);

/// file_of_value gives FILE when the text of a byte string is `@FILE`, and nothing otherwise.
[[nodiscard]] std::optional<std::string> file_of_value(const std::string& text);

/// is_printable_ascii tells whether a text has nothing but characters from blank to tilde.
[[nodiscard]] bool is_printable_ascii(std::string_view text);

/// parse_date reads ISO 8601: 2030-01-31, 2030-01-31T12:00, 2030-01-31T12:00:30.5, each with a Z or an offset such as
/// +02:00 behind it if wanted; without one it is UTC. Throws usage_error, also for dates before 1970.
[[nodiscard]] date parse_date(std::string_view text);
/// format_date gives 2030-01-31T12:00:30Z, with milliseconds where there are some.
[[nodiscard]] std::string format_date(std::uint64_t millis_since_1970);

/// parse_number reads a decimal number, or a hexadecimal one behind 0x, up to `largest`. Throws usage_error.
[[nodiscard]] std::uint64_t parse_number(std::string_view text, std::uint64_t largest);

/// parse_name reads one of a table's words. Throws usage_error that lists them; `what` names the kind of value.
[[nodiscard]] std::uint32_t parse_name(keymaster::client::name_table table, std::string_view what,
                                       std::string_view text);

/// list_names gives the words of a table: "none, md5, sha-1".
[[nodiscard]] std::string list_names(keymaster::client::name_table table);

/// format_size gives a byte count that reads well: "1,215 bytes", "3.4 MiB".
[[nodiscard]] std::string format_size(std::uint64_t count);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_VALUES_H_
