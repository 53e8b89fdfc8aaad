// kmctl finger: the fingerprint sensor, whose finger is whoever runs the command.
#include <fmt/format.h>

#include <array>
#include <optional>
#include <string>

#include "client/kmctl/commands.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/number_option.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/token_output.h"
#include "client/lib/attestation.h"
#include "client/lib/fingerprint.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

constexpr const char* enrol_examples =
    "The user's secure id is the one that kmctl auth enrol tells.\n\n"
    "Examples:\n"
    "  kmctl finger enrol 1234567890\n"
    "  kmctl finger enrol --json 0x499602d2 | jq .finger\n";

constexpr const char* touch_examples =
    "The Keymaster TA is told of the finger as well, and believes it when the device is provisioned. It remembers it,\n"
    "and the token holds, as long as the secure world runs. That ends with this command: kmctl sign and its like "
    "bring\n"
    "a touch of their own.\n\n"
    "Examples:\n"
    "  kmctl finger touch 1\n"
    "  kmctl finger touch 1 -o touch.token\n"
    "  kmctl finger touch 1 --challenge 17 -o touch.token\n";

constexpr const char* list_examples =
    "Examples:\n"
    "  kmctl finger list\n"
    "  kmctl finger list --json | jq '.fingers[].finger'\n";

constexpr const char* remove_examples =
    "Examples:\n"
    "  kmctl finger remove 1\n";

struct enrol_options {
  std::uint64_t secure_id = 0;

  void add_to(command_line& command) {
    add_number(command, "SECURE_ID", secure_id, "the user's secure id").required();
    command.footer(enrol_examples);
  }
};

int run_enrol(const enrol_options& options, const context& ctx) {
  client::connection tee(tee_name(ctx));
  const std::uint32_t id = client::fingerprint(tee).enrol(options.secure_id);
  tell(ctx, fmt::format("Finger {} enrolled for user {}", id, options.secure_id),
       {{"finger", id}, {"secure_id", options.secure_id}});
  return exit_done;
}

struct finger_option {
  std::uint32_t id = 0;

  void add_to(command_line& command) { add_number(command, "FINGER", id, "the finger's id").required(); }
};

struct touch_options {
  finger_option finger;
  std::uint64_t challenge = 0;
  std::optional<std::string> out;
  option extra_data_option;

  void add_to(command_line& command) {
    finger.add_to(command);
    add_number(command, "--challenge", challenge, "the operation that the token is for (default: 0, none)");
    extra_data_option = command.add_option("-o,--output", out, "file for the auth token, - for standard output");
    extra_data_option.type_name("FILE");
    command.footer(touch_examples);
  }
};

int run_touch(const touch_options& options, const context& ctx) {
  if (options.out) {
    check_binary_output(*options.out, token_rules);
  }
  tee_link tee(ctx);
  (void)client::is_ready(tee.ta());  // else no finger is believed; what comes of it, the touch tells
  const client::touch_result touched =
      client::fingerprint(tee.connection()).touch(options.finger.id, options.challenge);
  const std::string answer = client::tee_result_name(touched.keymaster_result);
  if (options.out) {
    write_binary(*options.out, touched.token, token_rules);
  }
  json object = {{"finger", options.finger.id},
                 {"keymaster_result", {{"name", answer}, {"value", touched.keymaster_result}}},
                 {"token", token_json(touched.token)}};
  if (options.out) {
    object["output"] = *options.out;
  }
  const bool believed = touched.keymaster_result == TEEC_SUCCESS;
  tell(ctx,
       fmt::format("Finger {} touched: the Keymaster TA {}\n{}{}", options.finger.id,
                   believed ? "took note of it" : "refused it (" + answer + ")", token_text(touched.token),
                   options.out ? ", token in " + *options.out : std::string{}),
       object);
  return exit_done;
}

struct list_options {
  void add_to(command_line& command) { command.footer(list_examples); }
};

int run_list(const list_options& /*options*/, const context& ctx) {
  client::connection tee(tee_name(ctx));
  std::string text;
  json fingers = json::array();
  for (const client::finger& one : client::fingerprint(tee).list()) {
    text += fmt::format("{}finger {}, user {}", text.empty() ? "" : "\n", one.id, one.secure_id);
    fingers.push_back({{"finger", one.id}, {"secure_id", one.secure_id}});
  }
  tell(ctx, text.empty() ? "no fingers are enrolled" : text, {{"fingers", fingers}});
  return exit_done;
}

struct remove_options {
  finger_option finger;

  void add_to(command_line& command) {
    finger.add_to(command);
    command.footer(remove_examples);
  }
};

int run_remove(const remove_options& options, const context& ctx) {
  client::connection tee(tee_name(ctx));
  client::fingerprint(tee).remove(options.finger.id);
  tell(ctx, fmt::format("Finger {} removed", options.finger.id), {{"removed", options.finger.id}});
  return exit_done;
}

constexpr std::array commands = std::to_array<command_row>({
    {"enrol", "Enrol a user's finger", define<enrol_options, run_enrol>},
    {"touch", "Touch the sensor", define<touch_options, run_touch>},
    {"list", "List the enrolled fingers", define<list_options, run_list>},
    {"remove", "Forget a finger", define<remove_options, run_remove>},
});

}  // namespace

void define_finger(command_line& group, context& ctx) {
  define_group(group, ctx, commands);
}

}  // namespace kmctl
