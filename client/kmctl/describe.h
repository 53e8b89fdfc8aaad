// A key's characteristics as people and as programs read them.
#ifndef KEYMASTER_CLIENT_KMCTL_DESCRIBE_H_
#define KEYMASTER_CLIENT_KMCTL_DESCRIBE_H_

#include <nlohmann/json.hpp>
#include <string>

#include "client/lib/authorizations.h"

namespace kmctl {

/// describe_text gives one line per tag, behind `indent` blanks: "  purpose                     sign, verify".
[[nodiscard]] std::string describe_text(const keymaster::client::authorizations& list, std::size_t indent = 2);

/// describe_json gives one member per tag, named as in the text with underscores. A tag that may be repeated, or is,
/// has an array. Byte strings are hexadecimal, dates ISO 8601; of the blob of another key there is
/// the "size" alone. A tag without a name is named by its number.
[[nodiscard]] nlohmann::ordered_json describe_json(const keymaster::client::authorizations& list);

/// key_title names the kind of key in a few characters: "RSA-2048".
[[nodiscard]] std::string key_title(const keymaster::client::authorizations& list);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_DESCRIBE_H_
