#include "client/kmctl/application.h"

#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <array>
#include <cstdlib>
#include <memory>
#include <sstream>
#include <string_view>

#include "client/kmctl/command_line.h"
#include "client/kmctl/commands.h"
#include "client/kmctl/console.h"
#include "client/kmctl/exit_codes.h"

namespace kmctl {
namespace {

constexpr std::array command_rows = std::to_array<command_row>({
    {"info", "Show the TEE, the TA and what it offers", define_info},
    {"generate", "Make a key and seal it into a blob", define_generate},
    {"import", "Seal an existing private key into a blob", define_import},
    {"export", "Write a key's public part", define_export},
    {"characteristics", "Show what a key may be used for", define_characteristics},
    {"sign", "Sign a file, or make its MAC", define_sign},
    {"verify", "Check a file's signature or MAC", define_verify},
    {"encrypt", "Encrypt a file", define_encrypt},
    {"decrypt", "Decrypt a file", define_decrypt},
    {"delete", "Delete a key", define_delete},
    {"delete-all", "Ask the TA to delete every key", define_delete_all},
    {"device", "Give the device its identity, once, in the factory", define_device},
    {"attest", "Show what the device attests its keys with", define_attest},
    {"finger", "Enrol fingers, and touch the sensor", define_finger},
    {"auth", "Enrol passwords, and turn them into auth tokens", define_auth},
    {"statement", "Check what devices state of their keys", define_statement},
    {"tee", "Look at a server of the TEE, and end it", define_tee},
    {"demo", "Show on a file of yours what the system does", define_demo},
});

constexpr const char* description =
    "kmctl makes and uses keys that exist outside the TEE only as sealed blobs.\n\n"
    "A first round:\n"
    "  kmctl generate key.blob\n"
    "  kmctl export key.blob -o public.pem\n"
    "  kmctl sign key.blob letter.txt -o letter.sig\n"
    "  kmctl verify key.blob letter.sig letter.txt\n"
    "  openssl dgst -sha256 -verify public.pem -signature letter.sig letter.txt\n"
    "Every sub-command has a --help with examples of its own.\n";

constexpr const char* environment_help =
    "Environment:\n"
    "  KEYMASTER_TEE      the TEE to use, as --tee\n"
    "  KEYMASTER_STATE    the state folder, as --state (default: keymaster below XDG_STATE_HOME or ~/.local/state)\n"
    "  KEYMASTER_TRACE    error, info or debug: the secure world's trace on standard error, as --trace\n"
    "  KEYMASTER_TA_PATH  the folder of the TA images\n";

void add_global_options(command_line& command, context& ctx) {
  const option tee = command.add_option("--tee", ctx.tee, "the TEE to use: embedded:FOLDER, or unix:PATH for a server")
                         .type_name("NAME");
  command
      .add_option("--state", ctx.state, "folder of the device's state; a blob opens only with the state that sealed it")
      .type_name("FOLDER")
      .excludes(tee);
  command.add_flag("--json", ctx.json_output,
                   "print results and errors as JSON: to standard output, or to standard error when data goes there");
  command
      .add_option_function(
          "--trace", [](const std::string& level) { ::setenv("KEYMASTER_TRACE", level.c_str(), 1); },
          "print the secure world's trace on standard error: error, info or debug")
      .one_of({"error", "info", "debug"})
      .type_name("LEVEL");
}

/// What parsing could not read yet, an error of the command line itself must still obey.
bool asks_for_json(int argc, const char* const* argv) {
  return std::any_of(argv, argv + argc, [](const char* word) { return std::string_view(word) == "--json"; });
}

/// As far as the command line names a sub-command: "kmctl", "kmctl device", "kmctl device status".
std::string chosen_command(const CLI::App& app) {
  std::string name = app.get_name();
  for (const CLI::App* at = &app; !at->get_subcommands().empty();) {
    at = at->get_subcommands().front();
    name += " " + at->get_name();
  }
  return name;
}

int parse_and_run(CLI::App& app, int argc, const char* const* argv, const context& ctx) {
  if (argc < 2) {
    complain(app.help());
    return exit_usage;
  }
  try {
    app.parse(argc, argv);
    return ctx.exit;
  } catch (const CLI::ParseError& stop) {
    if (stop.get_exit_code() == 0) {
      std::ostringstream text;  // --help or --version
      (void)app.exit(stop, text, text);
      print(text.str());
      return exit_done;
    }
    if (const auto rest = app.remaining(); app.get_subcommands().empty() && !rest.empty()) {
      throw usage_error(fmt::format("there is no sub-command '{}'", rest.front()), "see kmctl --help");
    }
    throw usage_error(stop.what(), "see " + chosen_command(app) + " --help");
  }
}

}  // namespace

void define_group(command_line& group, context& ctx, std::span<const command_row> commands) {
  group.require_subcommand();
  for (const command_row& row : commands) {
    command_line command = group.add_subcommand(row.name, row.description);
    row.define(command, ctx);
  }
}

std::unique_ptr<CLI::App> make_application(context& ctx) {
  auto app = std::make_unique<CLI::App>(description, "kmctl");
  app->footer(std::string(environment_help) + "\n" + exit_code_help);
  app->option_defaults()->always_capture_default(false);
  command_line whole(*app);
  add_global_options(whole, ctx);
  app->set_version_flag("--version", "kmctl " KEYMASTER_VERSION, "print the version");
  define_group(whole, ctx, command_rows);
  return app;
}

int run(int argc, const char* const* argv) noexcept {
  prepare_streams();
  context ctx;
  std::unique_ptr<CLI::App> app;  // knows where the data goes, so it is needed to tell of a failure
  try {
    ctx.json_output = asks_for_json(argc, argv);
    app = make_application(ctx);
    return parse_and_run(*app, argc, argv, ctx);
  } catch (const std::exception& failed) {
    const int code = exit_code_of(failed);
    try {
      tell_failure(ctx, failed);
    } catch (const std::exception&) {
      complain("kmctl: out of memory\n");  // there is none to put the message together
    }
    return code;
  }
}

}  // namespace kmctl
