// kmctl sign and kmctl verify: files of any size, streamed through the TA.
#include <fmt/format.h>

#include <string>
#include <vector>

#include "client/kmctl/authorization_options.h"
#include "client/kmctl/commands.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/signing.h"
#include "client/kmctl/user_presence.h"
#include "client/kmctl/values.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

constexpr const char* sign_examples =
    "Padding and digest are those of the key when it allows only one of each. An HMAC key makes a MAC, as long as its\n"
    "digest unless --mac-length says less; an EC signature is the DER that openssl takes.\n\n"
    "Examples:\n"
    "  kmctl sign key.blob letter.txt -o letter.sig\n"
    "  kmctl sign key.blob < letter.txt > letter.sig\n"
    "  kmctl sign --padding pss --digest sha-512 key.blob letter.txt -o letter.sig\n"
    "  kmctl sign hmac.blob letter.txt -o letter.mac\n"
    "  tar c folder | kmctl sign key.blob - -o folder.sig\n"
    "  kmctl sign --finger 1 key.blob letter.txt -o letter.sig          a key that needs its user\n"
    "  kmctl sign --auth-handle user.handle --auth-uid 1000 key.blob letter.txt -o letter.sig\n"
    "  kmctl sign --statement --finger 1 auth.blob challenge.txt -o sign.statement\n";

constexpr const char* verify_examples =
    "Exits with 0 when the signature or MAC belongs to the file and the key, with 6 when it does not.\n\n"
    "Examples:\n"
    "  kmctl verify key.blob letter.sig letter.txt\n"
    "  kmctl verify key.blob letter.sig < letter.txt\n"
    "  kmctl verify --padding pss --digest sha-512 key.blob letter.sig letter.txt\n";

struct signing_options {
  std::string blob;
  std::string file = "-";
  application_options app;
  authorization_options parameters;
  presence_options presence;

  [[nodiscard]] std::vector<std::string> inputs() const {
    std::vector<std::string> all{blob, file};
    for (const auto& more : {app.files(), parameters.files(), presence.files()}) {
      all.insert(all.end(), more.begin(), more.end());
    }
    return all;
  }
  void add_blob_to(command_line& command) {
    command.add_option("BLOB", blob, "sealed key, - for standard input").required().type_name("");
  }
  void add_rest_to(command_line& command) {
    command.add_option("FILE", file, "the data, - for standard input (the default)").type_name("");
    parameters.add_to(command, option_use::operation);
    presence.add_to(command);
    app.add_to(command);
  }
};

struct sign_options : signing_options {
  std::string out = "-";
  bool statement = false;
  option data_option;

  void add_to(command_line& command) {
    add_blob_to(command);
    add_rest_to(command);
    data_option = command.add_option("-o,--output", out, "file for the signature or MAC (default: standard output)");
    data_option.type_name("FILE");
    command.add_flag("--statement", statement, "make a signed statement of the message, with an attested key");
    command.footer(sign_examples);
  }
};

struct verify_options : signing_options {
  std::string signature;

  void add_to(command_line& command) {
    add_blob_to(command);
    command.add_option("SIGNATURE", signature, "the signature or MAC, - for standard input").required().type_name("");
    add_rest_to(command);
    command.footer(verify_examples);
  }
};

key_use use_of(const signing_options& options, client::session& ta, keymaster::keymaster_purpose_t purpose,
               byte_view blob, user_presence& user) {
  return make_key_use(ta, purpose, blob, options.app.given(), options.parameters.given(), &user);
}

/// The TA decides by the key what it makes, and nobody should take the one for the other.
void check_output_kind(const sign_options& options, const key_use& key) {
  if (key.makes_statements && !options.statement) {
    throw usage_error("this key is an attested one, and signs statements only", "say --statement");
  }
  if (!key.makes_statements && options.statement) {
    throw usage_error("only attested keys sign statements, and this is none", "leave --statement out");
  }
}

/// What a key of its algorithm makes.
const char* noun_of(const key_use& key) {
  return key.algorithm == keymaster::KM_ALGORITHM_HMAC ? "MAC" : "Signature";
}

int run_sign(const sign_options& options, const context& ctx) {
  refuse_shared_inputs(options.inputs());
  refuse_overwriting(options.out, options.inputs());
  check_binary_output(options.out, {});
  const bytes blob = read_small_file(options.blob, "key blob");
  input_file data(options.file);
  const bytes message = options.statement ? read_small_file(data, "message of a statement") : bytes{};
  tee_link tee(ctx);
  user_presence user(tee.connection(), options.presence);
  const key_use key = use_of(options, tee.ta(), keymaster::KM_PURPOSE_SIGN, blob, user);
  check_output_kind(options, key);
  const bytes output =
      options.statement ? sign_statement(tee.ta(), key, message) : sign_stream(tee.ta(), key, data_of(data));
  write_binary(options.out, output, {});
  json object = {{options.statement ? "statement" : "signature", options.out}, {"size", output.size()}};
  object.update(parameters_json(key));
  const std::string text = fmt::format("{} of {} in {} ({})", options.statement ? "Statement" : noun_of(key),
                                       format_size(output.size()), options.out, parameters_text(key));
  tell(ctx, options.out == "-" ? std::string{} : text, object);
  return exit_done;
}

int run_verify(const verify_options& options, const context& ctx) {
  std::vector<std::string> inputs = options.inputs();
  inputs.push_back(options.signature);
  refuse_shared_inputs(inputs);
  const bytes blob = read_small_file(options.blob, "key blob");
  const bytes signature = read_small_file(options.signature, "signature");
  input_file data(options.file);
  tee_link tee(ctx);
  user_presence user(tee.connection(), options.presence);
  const key_use key = use_of(options, tee.ta(), keymaster::KM_PURPOSE_VERIFY, blob, user);
  json object = {{"valid", true}};
  object.update(parameters_json(key));
  try {
    verify_stream(tee.ta(), key, data_of(data), signature);
  } catch (const client::error& refused) {
    if (!ctx.json_output || exit_code_of(refused) != exit_invalid) {
      throw;
    }
    object["valid"] = false;
    object["error"] = failure_json(refused);
    tell_failure_json(ctx, object);
    return exit_invalid;
  }
  tell(ctx, fmt::format("{} valid ({})", noun_of(key), parameters_text(key)), object);
  return exit_done;
}

}  // namespace

void define_sign(command_line& command, context& ctx) {
  define<sign_options>(command, ctx, run_sign);
}

void define_verify(command_line& command, context& ctx) {
  define<verify_options>(command, ctx, run_verify);
}

}  // namespace kmctl
