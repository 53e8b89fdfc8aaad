#include "client/lib/fingerprint.h"

#include "client/lib/auth_token.h"
#include "client/lib/wire.h"
#include "tee/companions/fingerprint/fingerprint_protocol.h"

namespace keymaster::client {
namespace {

namespace protocol = keymaster::fingerprint;

constexpr TEEC_UUID this_ta = FINGERPRINT_TA_UUID;

}  // namespace

fingerprint::fingerprint(connection& tee) : session_(tee, this_ta, "open_fingerprint") {}

std::uint32_t fingerprint::enrol(std::uint64_t secure_id) {
  slots parameters{slot::number_in(secure_id), slot::value_out()};
  session_.call("enrol_finger", protocol::COMMAND_ENROL, parameters);
  const std::uint32_t id = parameters[1].value().a;
  if (id == 0) {
    throw format_error("the fingerprint TA gives a finger the id 0, which stands for none");
  }
  return id;
}

touch_result fingerprint::touch(std::uint32_t id, std::uint64_t challenge) {
  bytes token(auth_token_size);
  slots parameters{slot::value_in(id), slot::number_in(challenge), slot::bytes_out(token), slot::value_out()};
  session_.call("touch_finger", protocol::COMMAND_TOUCH, parameters);
  token.resize(parameters[2].size());
  (void)parse_auth_token(token);
  return {.token = std::move(token), .keymaster_result = parameters[3].value().a};
}

void fingerprint::remove(std::uint32_t id) {
  slots parameters{slot::value_in(id)};
  session_.call("remove_finger", protocol::COMMAND_REMOVE, parameters);
}

std::vector<finger> fingerprint::list() {
  bytes records(std::size_t{protocol::finger_limit} * protocol::finger_record_size);
  slots parameters{slot::bytes_out(records)};
  session_.call("list_fingers", protocol::COMMAND_LIST, parameters);
  byte_reader in{byte_view(records).first(parameters[0].size())};
  std::vector<finger> fingers;
  while (in.remaining() != 0) {
    const std::uint32_t id = in.read_u32();
    fingers.push_back({.id = id, .secure_id = in.read_number(8)});
  }
  return fingers;
}

}  // namespace keymaster::client
