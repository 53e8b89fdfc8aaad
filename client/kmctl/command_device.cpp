// kmctl device: what a factory does, once in a device's life.
#include <fmt/format.h>

#include <array>
#include <optional>
#include <string>

#include "client/kmctl/commands.h"
#include "client/kmctl/device_properties.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/progress.h"
#include "client/kmctl/provisioning_plan.h"
#include "client/kmctl/values.h"
#include "client/lib/attestation.h"
#include "client/lib/factory_record.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

constexpr const char* provision_examples =
    "The device is asked afterwards whether it attests with that key and id, then the record is written, and last the\n"
    "device locked: nothing can be changed any more. The record is what who checks statements must know of the "
    "device:\n"
    "ids, names, and the public half of the attestation key, as JSON.\n\n"
    "Examples:\n"
    "  kmctl device provision --record device.json --lock\n"
    "  kmctl device provision --sensor-name FP-1 --sensor-version 2.0 --record device.json\n"
    "  kmctl device provision --key attk.pem --cpu-id 4711 --device-id hex:000102030405060708090a0b0c0d0e0f\n";

constexpr const char* status_examples =
    "Examples:\n"
    "  kmctl device status\n"
    "  kmctl device status --json | jq .locked\n";

struct provision_options {
  provisioning_plan plan;
  std::optional<std::string> record;
  bool lock = false;
  bool force = false;
  option extra_data_option;

  void add_to(command_line& command) {
    plan.add_to(command);
    extra_data_option = command.add_option("--record", record, "file for the factory record, - for standard output");
    extra_data_option.type_name("FILE");
    command.add_flag("--lock", lock, "lock the device at the end, for ever");
    command.add_flag("--force", force, "replace an attestation key that is there, and an existing record");
    command.footer(provision_examples);
  }
  [[nodiscard]] output_rules rules() const { return {.existing = force ? overwrite::always : overwrite::never}; }
};

void refuse_second_key(client::provisioning& device) {
  const client::provisioning_status present = device.status();
  if (present.key && !present.locked) {  // a locked device says so itself
    throw failure_error("the device has an attestation key already",
                        "--force replaces it, and the records of the present one are worth nothing any more");
  }
}

/// The Keymaster TA must attest with what was put in: here a factory finds out, and not the first user.
void check_device(client::session& ta, const client::rsa_public_key& attk, const provisioning_plan& plan) {
  client::verify_attk(ta);
  client::ensure_ready(ta);
  if (client::rsa_public_key::from_statement(client::export_attk(ta)) != attk) {
    throw failure_error("the device attests with another key than the one that was put in");
  }
  if (client::get_device_id(ta) != plan.device_id()) {
    throw failure_error("the device tells another id than the one that was put in");
  }
}

std::string property_of(client::device_information& tee, const char* name) {
  const auto value = tee.tee_property(name);
  if (!value) {
    throw failure_error(fmt::format("the TEE has no property {}, which the factory record needs", name));
  }
  return *value;
}

client::factory_record record_of(client::connection& tee, const client::rsa_public_key& attk,
                                 const provisioning_plan& plan) {
  client::device_information information(tee);
  return {.device_id = plan.device_id(),
          .cpu_id = plan.cpu_id(),
          .tee_n = property_of(information, "gpd.tee.trustedos.manufacturer"),
          .tee_v = property_of(information, "gpd.tee.trustedos.implementation.version"),
          .fp_n = plan.sensor_name(),
          .fp_v = plan.sensor_version(),
          .attk = attk.pem()};
}

client::rsa_public_key carry_out(const provisioning_plan& plan, client::provisioning& device) {
  const spinner alive(plan.imports_key() ? "Provisioning" : "Making the attestation key");
  return plan.carry_out(device);
}

void tell_provisioned(const provision_options& options, const provisioning_plan& plan, const context& ctx) {
  const std::string id = to_hex(plan.device_id());
  const char* const origin = plan.imports_key() ? "imported" : "generated";
  tell(ctx,
       fmt::format("Provisioned{}\n  attestation key   {}\n  device id         {}\n  cpu id            {}\n"
                   "  sensor            {}, version {}{}",
                   options.lock ? " and locked" : "", origin, id, plan.cpu_id(), plan.sensor_name(),
                   plan.sensor_version(), options.record ? "\n  factory record    " + *options.record : std::string{}),
       {{"attk", origin},
        {"device_id", id},
        {"cpu_id", plan.cpu_id()},
        {"fp_n", plan.sensor_name()},
        {"fp_v", plan.sensor_version()},
        {"record", options.record ? json(*options.record) : json(nullptr)},
        {"locked", options.lock}});
}

int run_provision(const provision_options& options, const context& ctx) {
  provisioning_plan plan = options.plan;
  if (options.record) {
    refuse_overwriting(*options.record, plan.inputs());
    check_output(*options.record, options.rules());
  }
  plan.complete();
  tee_link tee(ctx);
  client::provisioning device(tee.connection());
  if (!options.force) {
    refuse_second_key(device);
  }
  const client::rsa_public_key attk = carry_out(plan, device);
  check_device(tee.ta(), attk, plan);
  if (options.record) {
    const std::string text = client::write_factory_record(record_of(tee.connection(), attk, plan));
    write_file(*options.record, client::as_bytes(text), options.rules());
  }
  if (options.lock) {
    device.lock();
  }
  tell_provisioned(options, plan, ctx);
  return exit_done;
}

struct status_options {
  void add_to(command_line& command) { command.footer(status_examples); }
};

struct status_row {
  const char* name;
  const char* title;
  bool client::provisioning_status::*flag;
};

constexpr std::array status_rows = std::to_array<status_row>({
    {"key", "attestation key", &client::provisioning_status::key},
    {"soter_properties", "fingerprint sensor", &client::provisioning_status::soter_properties},
    {"cpu_id", "cpu id", &client::provisioning_status::cpu_id},
    {"device_id", "device id", &client::provisioning_status::device_id},
    {"data", "factory's own data", &client::provisioning_status::data},
});

int run_status(const status_options& /*options*/, const context& ctx) {
  client::connection tee(tee_name(ctx));
  const client::provisioning_status present = client::provisioning(tee).status();
  std::string text;
  json object;
  for (const status_row& row : status_rows) {
    text += fmt::format("{:<20}{}\n", row.title, present.*row.flag ? "present" : "none");
    object[row.name] = present.*row.flag;
  }
  object["locked"] = present.locked;
  tell(ctx, text + fmt::format("{:<20}{}", "locked", present.locked ? "yes" : "no"), object);
  return exit_done;
}

constexpr std::array commands = std::to_array<command_row>({
    {"provision", "Put the attestation key and the device's properties in", define<provision_options, run_provision>},
    {"status", "Show what is there, and whether the device is locked", define<status_options, run_status>},
});

}  // namespace

void define_device(command_line& group, context& ctx) {
  define_group(group, ctx, commands);
}

}  // namespace kmctl
