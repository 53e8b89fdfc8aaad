// kmctl statement verify: the relying party. It needs no TEE.
#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <optional>
#include <string>
#include <vector>

#include "client/kmctl/commands.h"
#include "client/kmctl/console.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/ledger.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/statement_options.h"
#include "client/lib/factory_record.h"
#include "client/lib/statement.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::rsa_public_key;
using client::statement_check;

constexpr const char* verify_examples =
    "Exits with 0 when the statement is accepted, and with 6 when it is not; the check that failed is named. Accept\n"
    "only what your own client had the TA make: a statement does not tell what else its key may do, nor where it came\n"
    "from. A challenge is random and used once. What is not asked for is not checked, and the answer says so.\n\n"
    "Examples:\n"
    "  kmctl statement verify --export --record factory.json --uid 1000 --ledger ledger.json \\\n"
    "        --public-key-out app.pem app.statement\n"
    "  kmctl statement verify --export --signer app.pem --uid 1000 --ledger ledger.json \\\n"
    "        --public-key-out auth.pem auth.statement\n"
    "  kmctl statement verify --sign --signer auth.pem --challenge @challenge.txt --any-finger --uid 1000 \\\n"
    "        --record factory.json --ledger ledger.json sign.statement\n";

struct verify_options : statement_options {
  void add_to(command_line& command) {
    statement_options::add_to(command);
    command.footer(verify_examples);
  }
};

rsa_public_key read_key(const std::string& file) {
  const bytes pem = read_small_file(file, "public key");
  return rsa_public_key::from_pem(client::as_text(pem));
}

/// An accepted key signs when one is named, and else the device's attestation key.
rsa_public_key signer_of(const verify_options& options, const std::optional<client::factory_record>& device) {
  if (!options.signer.empty()) {
    return read_key(options.signer);
  }
  return options.attk.empty() ? rsa_public_key::from_pem(device->attk) : read_key(options.attk);
}

/// What was accepted, and what goes on from there.
struct verdict {
  json facts;
  std::string text;
  std::optional<std::uint64_t> counter;
  std::string pem = {};
  std::vector<const char*> unchecked = {};
};

template <class Value>
json json_of(const std::optional<Value>& value) {
  return value ? json(*value) : json(nullptr);
}

/// Texts of the device are shown as JSON writes them, so that they can't act on the terminal.
std::string line_of(const char* title, const json& value) {
  return fmt::format("\n  {:<13}{}", title, value.is_null() ? "none" : value.dump(-1, ' ', true));
}

verdict verify_export(const verify_options& options, byte_view statement, const rsa_public_key& signer,
                      std::optional<std::uint64_t> last_counter) {
  const client::export_facts facts =
      client::verify_export_statement(statement, {.signer = signer, .uid = options.uid, .last_counter = last_counter});
  verdict accepted{.facts = {{"accepted", true},
                             {"statement", "export"},
                             {"counter", json_of(facts.counter)},
                             {"counter_gap", json_of(facts.counter_gap)},
                             {"uid", json_of(facts.uid)},
                             {"key_size", facts.key.bits()},
                             {"public_key", facts.key.pem()}},
                   .text = fmt::format("Accepted: the statement of an RSA-{} key", facts.key.bits()),
                   .counter = facts.counter,
                   .pem = facts.key.pem()};
  for (const char* const name : {"counter", "counter_gap", "uid"}) {
    accepted.text += line_of(name, accepted.facts[name]);
  }
  return accepted;
}

verdict verify_sign(const verify_options& options, byte_view statement, const rsa_public_key& signer,
                    const client::factory_record* device, std::optional<std::uint64_t> last_counter) {
  const client::sign_facts facts =
      client::verify_sign_statement(statement, {.signer = signer,
                                                .challenge = std::string(client::as_text(*options.challenge)),
                                                .scheme = options.scheme(),
                                                .fingers = options.expected_fingers(),
                                                .uid = options.uid,
                                                .last_counter = last_counter,
                                                .device = device});
  verdict accepted{.facts = {{"accepted", true},
                             {"statement", "sign"},
                             {"raw", facts.raw},
                             {"fid", json_of(facts.fid)},
                             {"counter", facts.counter},
                             {"counter_gap", json_of(facts.counter_gap)},
                             {"uid", json_of(facts.uid)},
                             {"tee_n", facts.tee_n},
                             {"tee_v", facts.tee_v},
                             {"fp_n", facts.fp_n},
                             {"fp_v", facts.fp_v},
                             {"cpu_id", facts.cpu_id}},
                   .text = "Accepted: the statement of a signed challenge",
                   .counter = facts.counter};
  for (const char* const name : {"fid", "counter", "counter_gap", "uid", "tee_n", "tee_v", "fp_n", "fp_v", "cpu_id"}) {
    accepted.text += line_of(name, accepted.facts[name]);
  }
  if (!options.expected_fingers()) {
    accepted.unchecked.push_back("fid");
  }
  if (device == nullptr) {
    accepted.unchecked.push_back("device");
  }
  return accepted;
}

const char* hint_for(statement_check check) {
  struct row {
    statement_check check;
    const char* hint;
  };
  constexpr std::array rows = std::to_array<row>({
      {statement_check::layout, "check that the file is a whole statement, and its signer the right key"},
      {statement_check::shape, "say --export for the statement of a key, --sign for that of a signed message"},
      {statement_check::signature, "check the signer, and for --sign the padding and digest of its signatures"},
      {statement_check::counter, "a statement is accepted once: have the device make a new one"},
      {statement_check::raw, "the statement answers another challenge: have the device sign this one"},
      {statement_check::fid,
       "have an expected finger, as --finger names them, touch within three seconds before the signature"},
      {statement_check::uid, "say with --uid whom the key was made for"},
  });
  const auto found = std::ranges::find(rows, check, &row::check);
  return found == rows.end() ? "do not trust whatever comes with it" : found->hint;
}

int tell_refusal(const context& ctx, const client::statement_refused& refused) {
  const std::string check(check_name(refused.check()));
  const char* const hint = hint_for(refused.check());
  if (ctx.json_output) {
    tell_failure_json(ctx, {{"accepted", false},
                            {"check", check},
                            {"error", {{"message", refused.what()}, {"hint", hint}, {"exit_code", exit_invalid}}}});
  } else {
    complain(fmt::format("kmctl: refused by the check {}: {}\n  hint: {}\n", check, refused.what(), hint));
  }
  return exit_invalid;
}

/// Keeps what was accepted: first the key, so that a failure there leaves the statement as good as it was.
void keep(const verify_options& options, const verdict& accepted, std::optional<ledger>& memory) {
  if (options.public_key_out) {
    write_file(*options.public_key_out, client::as_bytes(accepted.pem), {});
  }
  if (memory && accepted.counter) {
    memory->record(*accepted.counter);
  }
}

void tell_acceptance(const context& ctx, verdict accepted, bool counter_checked) {
  if (!counter_checked) {
    accepted.unchecked.push_back("counter");
  }
  accepted.facts["not_checked"] = accepted.unchecked;
  for (const char* const name : accepted.unchecked) {
    accepted.text += line_of("not checked", name);
  }
  tell(ctx, accepted.text, accepted.facts);
}

int run_verify(const verify_options& options, const context& ctx) {
  options.check();
  const bytes statement = read_small_file(options.statement, "statement");
  std::optional<client::factory_record> device;
  if (!options.record.empty()) {
    device = client::read_factory_record(read_small_file(options.record, "factory record"));
  }
  const rsa_public_key signer = signer_of(options, device);
  std::optional<ledger> memory;
  if (!options.ledger.empty()) {
    memory.emplace(options.ledger);
    if (device) {
      memory->expect_device(device->device_id);
    }
  }
  const auto last_counter = memory ? memory->counter() : options.last_counter;
  try {
    verdict accepted = options.of_export
                           ? verify_export(options, statement, signer, last_counter)
                           : verify_sign(options, statement, signer, device ? &*device : nullptr, last_counter);
    keep(options, accepted, memory);
    const bool counter_checked = last_counter && accepted.counter;
    tell_acceptance(ctx, std::move(accepted), counter_checked);
  } catch (const client::statement_refused& refused) {
    return tell_refusal(ctx, refused);
  }
  return exit_done;
}

constexpr std::array statement_rows = std::to_array<command_row>({
    {"verify", "Check a statement, as the party that relies on it", define<verify_options, run_verify>},
});

}  // namespace

void define_statement(command_line& group, context& ctx) {
  define_group(group, ctx, statement_rows);
}

}  // namespace kmctl
