#include "client/kmctl/user_presence.h"

#include <fmt/format.h>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/values.h"
#include "client/lib/authenticator.h"
#include "client/lib/fingerprint.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::authorizations;

/// With the public half of a key anybody may do what it does.
bool is_public(keymaster::keymaster_purpose_t purpose, const authorizations& key) {
  const std::uint64_t algorithm = key.unique_number(keymaster::KM_TAG_ALGORITHM).value_or(0);
  const bool has_public_half = algorithm == keymaster::KM_ALGORITHM_RSA || algorithm == keymaster::KM_ALGORITHM_EC;
  return has_public_half && (purpose == keymaster::KM_PURPOSE_VERIFY || purpose == keymaster::KM_PURPOSE_ENCRYPT);
}

bool needs_user(keymaster::keymaster_purpose_t purpose, const authorizations& key) {
  return key.contains(keymaster::KM_TAG_USER_SECURE_ID) && !key.contains(keymaster::KM_TAG_NO_AUTH_REQUIRED) &&
         !is_public(purpose, key);
}

}  // namespace

void presence_options::add_to(command_line& command) {
  constexpr const char* group = "User authentication";
  const auto take_number = [](std::optional<std::uint32_t>& to) {
    return [&to](const std::string& text) { to = static_cast<std::uint32_t>(parse_number(text, UINT32_MAX)); };
  };
  command
      .add_option_function("--finger", take_number(finger_),
                           "the finger that touches the sensor, as kmctl finger enrol numbered it")
      .type_name("ID")
      .group(group);
  const option handle =
      command.add_option("--auth-handle", handle_, "a user's password handle, as of kmctl auth enrol");
  const option uid = command.add_option_function("--auth-uid", take_number(uid_), "the number of that user");
  handle.type_name("FILE").group(group).needs(uid);
  uid.type_name("NUMBER").group(group).needs(handle);
  password_.add_to(command, "--password-file", "file with the password (default: it is asked)")
      .group(group)
      .needs(handle);
  waiting_.add_to(command).group(group).needs(handle);
}

std::vector<std::string> presence_options::files() const {
  std::vector<std::string> all;
  for (const std::string* const one : {&handle_, &password_.file()}) {
    if (!one->empty()) {
      all.push_back(*one);
    }
  }
  return all;
}

user_presence::user_presence(client::connection& tee, const presence_options& options) : tee_(tee), options_(options) {
  if (!options.handle_.empty()) {
    handle_ = read_small_file(options.handle_, "password handle");
    password_ = options.password_.read(fmt::format("Password of user {}: ", options.uid_.value_or(0)));
  }
}

void user_presence::suit(keymaster::keymaster_purpose_t purpose, const authorizations& characteristics,
                         bool tokens_given) {
  if (!options_.given()) {
    return;
  }
  if (tokens_given) {
    throw usage_error("an auth token was given already", "leave --auth-token out, or --finger and --auth-handle");
  }
  const bool needed = needs_user(purpose, characteristics);
  token_before_ = needed && characteristics.contains(keymaster::KM_TAG_AUTH_TIMEOUT);
  token_after_ = needed && !token_before_;
  finger_in_statement_ = options_.finger_.has_value() && purpose == keymaster::KM_PURPOSE_SIGN &&
                         characteristics.contains(keymaster::KM_TAG_SOTER_KEY);
  if (!needed && !finger_in_statement_) {
    throw usage_error("this use of the key needs no user", "leave --finger or --auth-handle out");
  }
  if (!needed && !handle_.empty()) {
    throw usage_error("this use of the key needs no password", "leave --auth-handle out");
  }
}

bytes user_presence::touch(std::uint64_t challenge) {
  client::touch_result touched = client::fingerprint(tee_).touch(options_.finger_.value_or(0), challenge);
  answer_to_touch_ = touched.keymaster_result;
  return std::move(touched.token);
}

authorizations user_presence::token(std::uint64_t challenge) {
  if (handle_.empty()) {
    return authorizations{}.auth_token(touch(challenge));
  }
  client::authenticator authenticator(tee_);
  return authorizations{}.auth_token(options_.waiting_.around(
      [&] { return authenticator.verify(options_.uid_.value_or(0), challenge, handle_, password_); }));
}

authorizations user_presence::before_begin() {
  return token_before_ ? token(0) : authorizations{};
}

authorizations user_presence::after_begin(std::uint32_t handle) {
  authorizations told = token_after_ ? token(handle) : authorizations{};
  const bool touched = token_after_ && handle_.empty();
  if (finger_in_statement_ && !touched) {
    (void)touch(handle);
  }
  if (finger_in_statement_ && answer_to_touch_ != TEEC_SUCCESS) {
    throw failure_error(
        fmt::format("the Keymaster TA does not believe the finger: {}", client::tee_result_name(answer_to_touch_)),
        "the device's properties must name this fingerprint TA: see kmctl device status");
  }
  return told;
}

}  // namespace kmctl
