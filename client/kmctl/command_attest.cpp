// kmctl attest: what the Keymaster TA says of the device's identity.
#include <fmt/format.h>

#include <array>
#include <string>

#include "client/kmctl/commands.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/values.h"
#include "client/lib/attestation.h"
#include "client/lib/rsa_public_key.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

constexpr const char* status_examples =
    "The device is ready when attestation key and properties are all there: only then attested keys can be made.\n\n"
    "Examples:\n"
    "  kmctl attest status\n"
    "  kmctl attest status --json | jq .ready\n";

constexpr const char* export_examples =
    "Examples:\n"
    "  kmctl attest export-attk                  the public key as PEM\n"
    "  kmctl attest export-attk -o attk.pem\n"
    "  kmctl attest export-attk | openssl pkey -pubin -text -noout\n";

constexpr const char* device_id_examples =
    "Examples:\n"
    "  kmctl attest device-id\n"
    "  kmctl attest device-id --json | jq -r .device_id\n";

struct status_options {
  void add_to(command_line& command) { command.footer(status_examples); }
};

const char* word_of(client::attk_status status) {
  switch (status) {
    case client::attk_status::present:
      return "present";
    case client::attk_status::absent:
      return "absent";
    case client::attk_status::unreadable:
      break;
  }
  return "unreadable";
}

int run_status(const status_options& /*options*/, const context& ctx) {
  tee_link tee(ctx);
  const char* const attk = word_of(client::get_attk_status(tee.ta()));
  const bool ready = client::is_ready(tee.ta());
  tell(ctx, fmt::format("attestation key  {}\nready            {}", attk, ready ? "yes" : "no"),
       {{"attk", attk}, {"ready", ready}});
  return exit_done;
}

struct export_options {
  std::string out = "-";
  option data_option;

  void add_to(command_line& command) {
    data_option = command.add_option("-o,--output", out, "file for the public key (default: standard output)");
    data_option.type_name("FILE");
    command.footer(export_examples);
  }
};

int run_export(const export_options& options, const context& ctx) {
  check_output(options.out, {});
  tee_link tee(ctx);
  const auto attk = client::rsa_public_key::from_statement(client::export_attk(tee.ta()));
  write_file(options.out, client::as_bytes(attk.pem()), {});
  if (options.out != "-" || ctx.json_output) {
    tell(ctx, fmt::format("Public part of the attestation key (RSA-{}) in {}", attk.bits(), options.out),
         {{"output", options.out}, {"format", "pem"}, {"key", fmt::format("RSA-{}", attk.bits())}});
  }
  return exit_done;
}

struct device_id_options {
  void add_to(command_line& command) { command.footer(device_id_examples); }
};

int run_device_id(const device_id_options& /*options*/, const context& ctx) {
  tee_link tee(ctx);
  const std::string id = to_hex(client::get_device_id(tee.ta()));
  tell(ctx, id, {{"device_id", id}});
  return exit_done;
}

constexpr std::array commands = std::to_array<command_row>({
    {"status", "Tell whether the attestation key can be used", define<status_options, run_status>},
    {"export-attk", "Write the attestation key's public part", define<export_options, run_export>},
    {"device-id", "Show the device's id", define<device_id_options, run_device_id>},
});

}  // namespace

void define_attest(command_line& group, context& ctx) {
  define_group(group, ctx, commands);
}

}  // namespace kmctl
