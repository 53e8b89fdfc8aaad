#include "client/kmctl/token_output.h"

#include <fmt/format.h>

#include "client/lib/auth_token.h"
#include "client/lib/names.h"

namespace kmctl {

namespace client = keymaster::client;

json token_json(byte_view token) {
  const client::auth_token told = client::parse_auth_token(token);
  return {{"type", client::name_of(client::auth_type_names, told.type)},
          {"secure_id", told.secure_id},
          {"authenticator_id", told.authenticator_id},
          {"challenge", told.challenge},
          {"timestamp_ms", told.timestamp_ms}};
}

std::string token_text(byte_view token) {
  const client::auth_token told = client::parse_auth_token(token);
  return fmt::format("{} of user {}, {}", client::name_of(client::auth_type_names, told.type), told.secure_id,
                     told.challenge == 0 ? "for no operation" : fmt::format("for operation {}", told.challenge));
}

}  // namespace kmctl
