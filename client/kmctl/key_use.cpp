#include "client/kmctl/key_use.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>

#include "client/kmctl/operation_parameters.h"
#include "client/kmctl/progress.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::authorizations;

constexpr std::array told_tags{keymaster::KM_TAG_BLOCK_MODE, keymaster::KM_TAG_PADDING, keymaster::KM_TAG_DIGEST,
                               keymaster::KM_TAG_MAC_LENGTH};

}  // namespace

key_use make_key_use(client::session& ta, keymaster::keymaster_purpose_t purpose, byte_view blob,
                     const client::application& app, const authorizations& given, user_presence* user) {
  const authorizations characteristics = client::get_characteristics(ta, blob, app);
  if (user != nullptr) {
    user->suit(purpose, characteristics, given.contains(keymaster::KM_TAG_AUTH_TOKEN));
  }
  key_use key{.blob = blob,
              .app = app,
              .parameters = operation_parameters(purpose, given, characteristics),
              .each_step = {},
              .algorithm = characteristics.unique_number(keymaster::KM_TAG_ALGORITHM).value_or(0),
              .makes_statements = characteristics.contains(keymaster::KM_TAG_SOTER_KEY),
              .user = user};
  for (const client::authorization& one : key.parameters) {
    if (one.tag == keymaster::KM_TAG_AUTH_TOKEN) {
      key.each_step.auth_token(one.blob);
    }
  }
  return key;
}

key_operation begin_use(client::session& ta, keymaster::keymaster_purpose_t purpose, const key_use& key) {
  authorizations parameters = key.parameters;
  if (key.user != nullptr) {
    parameters.add(key.user->before_begin());
  }
  key_operation running{.op = client::operation::begin(ta, purpose, key.blob, parameters, key.app),
                        .each_step = key.each_step};
  if (key.user != nullptr) {
    running.each_step.add(key.user->after_begin(running.op.handle()));
  }
  return running;
}

json parameters_json(const key_use& key) {
  json object = json::object();
  for (const keymaster::keymaster_tag_t tag : told_tags) {
    if (const auto value = key.parameters.unique_number(tag)) {
      const client::tag_name* const row = client::find_tag(tag);
      std::string name(row->name);
      std::ranges::replace(name, '-', '_');
      object[name] = row->values.empty() ? json(*value) : json(client::name_of(row->values, *value));
    }
  }
  return object;
}

std::string parameters_text(const key_use& key) {
  const json object = parameters_json(key);
  std::string text;
  for (const auto& [name, value] : object.items()) {
    if (name == "padding" && value == "none" && key.algorithm != keymaster::KM_ALGORITHM_RSA) {
      continue;  // goes without saying
    }
    const std::string told =
        value.is_string() ? value.get<std::string>() : fmt::format("{} bits", value.get<std::uint64_t>());
    text += (text.empty() ? "" : ", ") + told;
  }
  return text;
}

data_stream data_of(input_file& file) {
  return {.read = [&file](std::span<std::uint8_t> buffer) { return file.read(buffer); }, .total = file.size()};
}

void feed(key_operation& running, const data_stream& data, const char* label, const client::byte_sink& sink) {
  progress_bar bar(label, data.total);
  const auto source = [&](std::span<std::uint8_t> buffer) {
    const std::size_t filled = data.read(buffer);
    bar.advance(filled);
    return filled;
  };
  client::stream(running.op, source, sink, running.each_step);
}

}  // namespace kmctl
