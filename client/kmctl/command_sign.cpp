// kmctl sign and kmctl verify: files of any size, streamed through the TA.
#include <fmt/format.h>

#include <algorithm>
#include <initializer_list>

#include "client/kmctl/authorization_options.h"
#include "client/kmctl/commands.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/signing.h"
#include "client/kmctl/values.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::authorizations;

constexpr const char* sign_examples =
    "Padding and digest are those of the key when it allows only one of each.\n\n"
    "Examples:\n"
    "  kmctl sign key.blob letter.txt -o letter.sig\n"
    "  kmctl sign key.blob < letter.txt > letter.sig\n"
    "  kmctl sign --padding pss --digest sha-512 key.blob letter.txt -o letter.sig\n"
    "  tar c folder | kmctl sign key.blob - -o folder.sig\n";

constexpr const char* verify_examples =
    "Exits with 0 when the signature belongs to the file and the key, with 6 when it does not.\n\n"
    "Examples:\n"
    "  kmctl verify key.blob letter.sig letter.txt\n"
    "  kmctl verify key.blob letter.sig < letter.txt\n"
    "  kmctl verify --padding pss --digest sha-512 key.blob letter.sig letter.txt\n";

struct signing_options {
  std::string blob;
  std::string file = "-";
  application_options app;
  authorization_options parameters;

  void add_blob_to(CLI::App& command) {
    command.add_option("BLOB", blob, "sealed key, - for standard input")->required()->type_name("");
  }
  void add_rest_to(CLI::App& command) {
    command.add_option("FILE", file, "the data, - for standard input (the default)")->type_name("");
    parameters.add_to(command, option_use::operation);
    app.add_to(command);
  }
};

struct sign_options : signing_options {
  std::string out = "-";

  void add_to(CLI::App& command) {
    add_blob_to(command);
    add_rest_to(command);
    command.add_option("-o,--output", out, "file for the signature (default: standard output)")->type_name("FILE");
    command.footer(sign_examples);
  }
};

struct verify_options : signing_options {
  std::string signature;

  void add_to(CLI::App& command) {
    add_blob_to(command);
    command.add_option("SIGNATURE", signature, "the signature, - for standard input")->required()->type_name("");
    add_rest_to(command);
    command.footer(verify_examples);
  }
};

void refuse_shared_input(std::initializer_list<const std::string*> inputs) {
  if (std::ranges::count(inputs, "-", [](const std::string* path) { return *path; }) > 1) {
    throw usage_error("only one input can come from standard input");
  }
}

/// The key of a command, its own parameters completed by what its characteristics leave open.
signing_key key_of(const signing_options& options, client::session& ta, byte_view blob) {
  signing_key key{.blob = blob, .app = options.app.given(), .parameters = {}, .each_step = {}};
  const authorizations characteristics = client::get_characteristics(ta, blob, key.app);
  key.parameters = operation_parameters(options.parameters.given(), characteristics);
  for (const client::authorization& one : key.parameters) {
    if (one.tag == keymaster::KM_TAG_AUTH_TOKEN) {
      key.each_step.auth_token(one.blob);
    }
  }
  return key;
}

std::string parameter_name(const authorizations& list, keymaster::keymaster_tag_t tag) {
  const auto value = list.unique_number(tag);
  return value ? client::name_of(client::find_tag(tag)->values, *value) : "none";
}

json parameters_json(const signing_key& key) {
  return {{"padding", parameter_name(key.parameters, keymaster::KM_TAG_PADDING)},
          {"digest", parameter_name(key.parameters, keymaster::KM_TAG_DIGEST)}};
}

int run_sign(const sign_options& options, const context& ctx) {
  refuse_shared_input({&options.blob, &options.file});
  if (same_file(options.out, options.blob) || same_file(options.out, options.file)) {
    throw usage_error("the signature would overwrite an input");
  }
  const bytes blob = read_small_file(options.blob, "key blob");
  input_file data(options.file);
  tee_link tee(ctx);
  const signing_key key = key_of(options, tee.ta(), blob);
  const bytes signature = sign_stream(tee.ta(), key, data_of(data));
  write_binary(options.out, signature, {});
  json object = {{"signature", options.out}, {"size", signature.size()}};
  object.update(parameters_json(key));
  const std::string text = fmt::format("Signature of {} in {} ({}, {})", format_size(signature.size()), options.out,
                                       object["padding"].get<std::string>(), object["digest"].get<std::string>());
  tell(ctx, options.out == "-" ? std::string{} : text, object, options.out);
  return exit_done;
}

int run_verify(const verify_options& options, const context& ctx) {
  refuse_shared_input({&options.blob, &options.signature, &options.file});
  const bytes blob = read_small_file(options.blob, "key blob");
  const bytes signature = read_small_file(options.signature, "signature");
  input_file data(options.file);
  tee_link tee(ctx);
  const signing_key key = key_of(options, tee.ta(), blob);
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
    tell(ctx, {}, object);
    return exit_invalid;
  }
  tell(ctx,
       fmt::format("Signature valid ({}, {})", object["padding"].get<std::string>(),
                   object["digest"].get<std::string>()),
       object);
  return exit_done;
}

}  // namespace

void define_sign(CLI::App& command, context& ctx) {
  define<sign_options>(command, ctx, run_sign);
}

void define_verify(CLI::App& command, context& ctx) {
  define<verify_options>(command, ctx, run_verify);
}

}  // namespace kmctl
