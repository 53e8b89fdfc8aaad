#include "client/lib/auth_token.h"

#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

constexpr std::uint8_t known_version = 0;

/// The last two numbers of a token have their highest byte first, unlike those before them.
std::uint64_t big_endian(byte_view field) {
  std::uint64_t number = 0;
  for (const std::uint8_t one : field) {
    number = number << 8 | one;
  }
  return number;
}

}  // namespace

auth_token parse_auth_token(byte_view token) {
  if (token.size() != auth_token_size) {
    throw format_error("an auth token has " + std::to_string(auth_token_size) + " bytes, not " +
                       std::to_string(token.size()));
  }
  byte_reader in{token};
  if (const std::uint64_t version = in.read_number(1); version != known_version) {
    throw format_error("auth tokens of version " + std::to_string(version) + " are not known");
  }
  auth_token told;
  told.challenge = in.read_number(8);
  told.secure_id = in.read_number(8);
  told.authenticator_id = in.read_number(8);
  told.type = static_cast<std::uint32_t>(big_endian(in.read_bytes(4)));
  told.timestamp_ms = big_endian(in.read_bytes(8));
  return told;
}

}  // namespace keymaster::client
