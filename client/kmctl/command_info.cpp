// kmctl info: the TEE, the TA and its capability tables.
#include <fmt/format.h>

#include <vector>

#include "client/kmctl/commands.h"
#include "client/kmctl/device_properties.h"
#include "client/lib/capabilities.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

constexpr const char* examples =
    "Examples:\n"
    "  kmctl info\n"
    "  kmctl info --json | jq '.algorithms[].name'\n"
    "  kmctl --state /tmp/device info     a device of its own, made on first use\n";

struct info_options {
  void add_to(command_line& command) { command.footer(examples); }
};

constexpr TEEC_UUID keymaster_ta = KEYMASTER_TA_UUID;

std::string text_of(const TEEC_UUID& id) {
  std::string text = fmt::format("{:08x}-{:04x}-{:04x}-", id.timeLow, id.timeMid, id.timeHiAndVersion);
  for (std::size_t i = 0; i < 8; ++i) {
    text += fmt::format("{}{:02x}", i == 2 ? "-" : "", id.clockSeqAndNode[i]);
  }
  return text;
}

json names_json(client::name_table table, const std::vector<std::uint32_t>& values) {
  json list = json::array();
  for (const std::uint32_t value : values) {
    list.push_back(client::name_of(table, value));
  }
  return list;
}

json purpose_json(const client::purpose_capabilities& purpose) {
  return {{"name", client::name_of(client::purpose_names, purpose.purpose)},
          {"block_modes", names_json(client::block_mode_names, purpose.block_modes)},
          {"paddings", names_json(client::padding_names, purpose.paddings)},
          {"digests", names_json(client::digest_names, purpose.digests)}};
}

json algorithm_json(const client::algorithm_capabilities& algorithm) {
  json purposes = json::array();
  for (const auto& purpose : algorithm.purposes) {
    purposes.push_back(purpose_json(purpose));
  }
  return {{"name", client::name_of(client::algorithm_names, algorithm.algorithm)},
          {"purposes", purposes},
          {"import_formats", names_json(client::key_format_names, algorithm.import_formats)},
          {"export_formats", names_json(client::key_format_names, algorithm.export_formats)}};
}

std::string line(const char* title, const json& values) {
  std::string text;
  for (const auto& value : values) {
    text += (text.empty() ? "" : ", ") + value.get<std::string>();
  }
  return values.empty() ? std::string{} : fmt::format("\n    {:<14}{}", title, text);
}

std::string algorithm_text(const json& algorithm) {
  std::string text = fmt::format("\n\n{}", algorithm["name"].get<std::string>());
  text += line("import", algorithm["import_formats"]);
  text += line("export", algorithm["export_formats"]);
  if (algorithm["purposes"].empty()) {
    text += "\n    not offered by this TA";
  }
  for (const auto& purpose : algorithm["purposes"]) {
    text += fmt::format("\n  {}", purpose["name"].get<std::string>());
    text += line("block modes", purpose["block_modes"]);
    text += line("paddings", purpose["paddings"]);
    text += line("digests", purpose["digests"]);
  }
  return text;
}

int run_info(const info_options& /*options*/, const context& ctx) {
  tee_link tee(ctx);
  json algorithms = json::array();
  for (const auto& algorithm : client::get_capabilities(tee.ta())) {
    algorithms.push_back(algorithm_json(algorithm));
  }
  const device_properties properties = read_properties(tee.connection(), keymaster_ta);
  const std::string ta = text_of(keymaster_ta);
  std::string text = fmt::format("kmctl    {}\nTEE      {}{}\nTA       {} (Keymaster){}", KEYMASTER_VERSION, tee.name(),
                                 tee_text(properties), ta, ta_text(properties));
  for (const auto& algorithm : algorithms) {
    text += algorithm_text(algorithm);
  }
  json object = {{"tee", tee.name()}, {"ta", ta}, {"version", KEYMASTER_VERSION}};
  object.update(properties_json(properties));
  object["algorithms"] = algorithms;
  tell(ctx, text, object);
  return 0;
}

}  // namespace

void define_info(command_line& command, context& ctx) {
  define<info_options>(command, ctx, run_info);
}

}  // namespace kmctl
