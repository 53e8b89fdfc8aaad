#include "client/kmctl/statement_options.h"

#include <array>
#include <functional>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/values.h"
#include "client/lib/names.h"
#include "client/lib/statement.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

/// Adds an option whose every use is handed to `take`.
option add_value(command_line& command, const char* group, const char* flag, const char* type,
                 const std::function<void(const std::string&)>& take, const char* help) {
  return command.add_option_function(flag, take, help).type_name(type).group(group).trigger_on_parse();
}

}  // namespace

void statement_options::add_to(command_line& command) {
  command.add_option("STATEMENT", statement, "the statement, - for standard input").required().type_name("");
  constexpr const char* group = "Kind of statement";
  const option key_flag =
      command.add_flag("--export", of_export, "of a key: what kmctl export --statement writes").group(group);
  command.add_flag("--sign", of_sign, "of a signed message: what kmctl sign --statement writes")
      .group(group)
      .excludes(key_flag);
  add_signer_options(command);
  add_message_options(command);
  add_memory_options(command);
}

void statement_options::add_signer_options(command_line& command) {
  constexpr const char* group = "Who signed it";
  const auto add = [&](const char* flag, std::string& to, const char* help) {
    return command.add_option(flag, to, help).type_name("FILE").group(group);
  };
  const option record_option = add("--record", record, "the device's factory record, with its attestation key");
  add("--attk", attk, "the device's attestation key (PEM), where there is no record").excludes(record_option);
  add("--signer", signer, "a key that was accepted before (PEM), as --public-key-out writes it");
  extra_data_option =
      command.add_option("--public-key-out", public_key_out, "file for the accepted key (PEM), - for standard output");
  extra_data_option.type_name("FILE").group(group);
}

void statement_options::add_message_options(command_line& command) {
  constexpr const char* group = "What it must say";
  const auto take_challenge = [this](const std::string& text) {
    if (const auto file = file_of_value(text)) {
      value_files_.push_back(*file);
    }
    challenge = parse_bytes(text);
  };
  add_value(command, group, "--challenge", "VALUE", take_challenge,
            "the message that was to be signed: text, hex:00ff17 or @FILE");
  const auto take_finger = [this](const std::string& text) {
    fingers.push_back(static_cast<std::uint32_t>(parse_number(text, UINT32_MAX - 1)));
    if (fingers.back() == 0) {
      throw usage_error("no finger has the id 0", "kmctl finger list shows those that are enrolled");
    }
  };
  add_value(command, group, "--finger", "ID", take_finger, "a finger that may have touched; repeat it for others")
      .take_last();
  command.add_flag("--any-finger", any_finger, "some finger must have touched").group(group);
  const auto take_uid = [this](const std::string& text) {
    uid = static_cast<std::uint32_t>(parse_number(text, client::no_uid - 1));
  };
  add_value(command, group, "--uid", "NUMBER", take_uid, "the user that the key was made for (default: none)");
  const auto take_padding = [this](const std::string& text) {
    padding_ = parse_name(client::padding_names, "padding", text);
  };
  add_value(command, group, "--padding", "NAME", take_padding,
            "padding of the key's signatures: pkcs1-1-5-sign (the default) or pss");
  const auto take_digest = [this](const std::string& text) {
    digest_ = parse_name(client::digest_names, "digest", text);
  };
  add_value(command, group, "--digest", "NAME", take_digest, "digest of the key's signatures (default: sha-256)");
}

void statement_options::add_memory_options(command_line& command) {
  constexpr const char* group = "The device's counter";
  const auto take_counter = [this](const std::string& text) { last_counter = parse_number(text, UINT64_MAX); };
  const option last = add_value(command, group, "--last-counter", "NUMBER", take_counter,
                                "the last one seen of this device, in any of its statements");
  command
      .add_option("--ledger", ledger, "file that remembers the last one; it is begun, and written after an acceptance")
      .type_name("FILE")
      .group(group)
      .excludes(last);
}

std::vector<std::string> statement_options::inputs() const {
  std::vector<std::string> all{statement};
  for (const std::string* const one : {&attk, &record, &signer, &ledger}) {
    if (!one->empty()) {
      all.push_back(*one);
    }
  }
  all.insert(all.end(), value_files_.begin(), value_files_.end());
  return all;
}

/// Who gives an option that says nothing about this kind of statement expects a check that isn't made.
void statement_options::check_kind() const {
  if (!of_export && !of_sign) {
    throw usage_error("statements are of two kinds", "say --export for that of a key, --sign for that of a message");
  }
  struct row {
    bool given;
    bool fits;
    const char* what;
  };
  for (const row& one : std::to_array<row>({
           {!attk.empty(), of_export, "--attk goes with --export: the attestation key signs no messages"},
           {public_key_out.has_value(), of_export, "--public-key-out goes with --export"},
           {challenge.has_value(), of_sign, "--challenge goes with --sign"},
           {!fingers.empty(), of_sign, "--finger goes with --sign"},
           {any_finger, of_sign, "--any-finger goes with --sign"},
           {padding_.has_value(), of_sign, "--padding goes with --sign"},
           {digest_.has_value(), of_sign, "--digest goes with --sign"},
       })) {
    if (one.given && !one.fits) {
      throw usage_error(one.what, "leave it out");
    }
  }
  if (any_finger && !fingers.empty()) {
    throw usage_error("--any-finger takes every finger, and --finger only those it names", "leave one of them out");
  }
}

void statement_options::check_signer() const {
  if (of_sign && signer.empty()) {
    throw usage_error("a sign statement is checked with the key that made it",
                      "name the key that you accepted with --signer");
  }
  if (of_sign && !challenge) {
    throw usage_error("a sign statement answers a challenge", "say with --challenge what was to be signed");
  }
  if (of_export && attk.empty() && record.empty() && signer.empty()) {
    throw usage_error("there is nobody whose signature could be checked",
                      "name the device's attestation key with --record or --attk, or an accepted key with --signer");
  }
  if (!attk.empty() && !signer.empty()) {
    throw usage_error("either the attestation key signed the statement or another one", "leave --attk or --signer out");
  }
}

void statement_options::check_files() const {
  refuse_shared_input({&statement, &attk, &record, &signer});
  if (ledger == "-") {
    throw usage_error("a ledger is a file", "name one that this program may write");
  }
  if (!ledger.empty()) {
    check_output(ledger, {});
  }
  if (public_key_out) {
    if (*public_key_out == ledger) {
      throw usage_error("the accepted key needs a file of its own", "name another one with --public-key-out");
    }
    refuse_overwriting(*public_key_out, inputs());
    check_output(*public_key_out, {});
  }
}

void statement_options::check() const {
  check_kind();
  check_signer();
  (void)scheme();
  check_files();
}

client::signature_scheme statement_options::scheme() const {
  const std::uint32_t padding = padding_.value_or(keymaster::KM_PAD_RSA_PKCS1_1_5_SIGN);
  const std::uint32_t digest = digest_.value_or(keymaster::KM_DIGEST_SHA_2_256);
  if (padding != keymaster::KM_PAD_RSA_PSS && padding != keymaster::KM_PAD_RSA_PKCS1_1_5_SIGN) {
    throw usage_error("statements are signed with pkcs1-1-5-sign or pss", "say which one with --padding");
  }
  if (digest == keymaster::KM_DIGEST_NONE) {
    throw usage_error("statements are signed by their digest", "say which one with --digest");
  }
  return {.padding = keymaster::keymaster_padding_t{padding}, .digest = keymaster::keymaster_digest_t{digest}};
}

std::optional<std::vector<std::uint32_t>> statement_options::expected_fingers() const {
  const bool asked = any_finger || !fingers.empty();
  return asked ? std::optional(fingers) : std::nullopt;
}

}  // namespace kmctl
