// Auth tokens as kmctl writes and tells them.
#ifndef KEYMASTER_CLIENT_KMCTL_TOKEN_OUTPUT_H_
#define KEYMASTER_CLIENT_KMCTL_TOKEN_OUTPUT_H_

#include <string>

#include "client/kmctl/context.h"
#include "client/kmctl/output_file.h"
#include "client/lib/bytes.h"

namespace kmctl {

/// A token opens keys, so that only its owner can read the file.
inline constexpr output_rules token_rules{.mode = 0600};

/// token_json gives what a token says: "type", "secure_id", "authenticator_id", "challenge" and "timestamp_ms".
/// token_text gives the same in a line. Throw format_error for what is no token.
[[nodiscard]] json token_json(byte_view token);
[[nodiscard]] std::string token_text(byte_view token);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_TOKEN_OUTPUT_H_
