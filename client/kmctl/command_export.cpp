// kmctl export, characteristics, delete and delete-all: what can be told of a sealed key, and its end.
#include <fmt/format.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <vector>

#include "client/kmctl/authorization_options.h"
#include "client/kmctl/commands.h"
#include "client/kmctl/describe.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/system_failure.h"
#include "client/kmctl/values.h"
#include "client/lib/key_material.h"
#include "client/lib/statement.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::authorizations;

constexpr const char* export_examples =
    "The TA exports an attested key as a signed statement only. Without --statement the public key is taken out of "
    "it,\n"
    "and a counter of the device may have moved.\n\n"
    "Examples:\n"
    "  kmctl export key.blob                     the public key as PEM\n"
    "  kmctl export key.blob --der -o public.der\n"
    "  kmctl export key.blob | openssl pkey -pubin -text -noout\n"
    "  kmctl export --statement app.blob -o app.statement     for kmctl statement verify\n";

constexpr const char* characteristics_examples =
    "Examples:\n"
    "  kmctl characteristics key.blob\n"
    "  kmctl characteristics --json key.blob | jq .characteristics.padding\n"
    "  kmctl characteristics --app-id my.app key.blob\n";

constexpr const char* delete_examples =
    "The TA keeps nothing per key: it is asked, and then the file is removed. A copy of the blob elsewhere still "
    "works.\n\n"
    "Examples:\n"
    "  kmctl delete key.blob\n";

constexpr const char* delete_all_examples =
    "The TA keeps nothing per key: it is asked, and no file is touched. Blobs still work afterwards; a key ends with "
    "the\n"
    "last copy of its blob.\n\n"
    "Examples:\n"
    "  kmctl delete-all\n";

struct sealed_key {
  std::string path;
  application_options app;

  void add_to(command_line& command) {
    command.add_option("BLOB", path, "sealed key, - for standard input").required().type_name("");
    app.add_to(command);
  }
  [[nodiscard]] bytes read() const { return read_small_file(path, "key blob"); }
};

struct export_options {
  sealed_key key;
  std::string out = "-";
  bool der = false;
  bool statement = false;
  option data_option;

  void add_to(command_line& command) {
    key.add_to(command);
    data_option = command.add_option("-o,--output", out, "file for the public key (default: standard output)");
    data_option.type_name("FILE");
    const option der_flag = command.add_flag("--der", der, "DER in place of PEM");
    command.add_flag("--statement", statement, "the signed statement of an attested key").excludes(der_flag);
    command.footer(export_examples);
  }
  [[nodiscard]] bool binary() const { return der || statement; }
  [[nodiscard]] const char* format() const {
    if (statement) {
      return "statement";
    }
    return der ? "der" : "pem";
  }
};

bytes bytes_of(const std::string& text) {
  return {text.begin(), text.end()};
}

/// What the TA exported, in the form that was asked for.
bytes exported_form(const export_options& options, const authorizations& characteristics, const bytes& exported) {
  if (options.statement) {
    return exported;
  }
  if (characteristics.contains(keymaster::KM_TAG_SOTER_KEY)) {
    const client::rsa_public_key key = client::told_key(exported);
    return options.der ? key.der() : bytes_of(key.pem());
  }
  const auto algorithm = static_cast<keymaster::keymaster_algorithm_t>(
      characteristics.unique_number(keymaster::KM_TAG_ALGORITHM).value_or(0));
  return options.der ? client::public_key_der(algorithm, exported)
                     : bytes_of(client::public_key_pem(algorithm, exported));
}

int run_export(const export_options& options, const context& ctx) {
  std::vector<std::string> inputs = options.key.app.files();
  inputs.push_back(options.key.path);
  refuse_overwriting(options.out, inputs);
  (options.binary() ? check_binary_output : check_output)(options.out, {});
  const bytes blob = options.key.read();
  tee_link tee(ctx);
  const authorizations characteristics = client::get_characteristics(tee.ta(), blob, options.key.app.given());
  if (options.statement && !characteristics.contains(keymaster::KM_TAG_SOTER_KEY)) {
    throw usage_error("only attested keys have a statement, and this is none", "leave --statement out");
  }
  const bytes content =
      exported_form(options, characteristics, client::export_key(tee.ta(), blob, options.key.app.given()));
  (options.binary() ? write_binary : write_file)(options.out, content, {});
  if (options.out != "-" || ctx.json_output) {
    tell(ctx,
         fmt::format("{} of the {} key in {}", options.statement ? "Statement" : "Public part",
                     key_title(characteristics), options.out),
         {{"output", options.out}, {"format", options.format()}, {"key", key_title(characteristics)}});
  }
  return exit_done;
}

struct characteristics_options {
  sealed_key key;

  void add_to(command_line& command) {
    key.add_to(command);
    command.footer(characteristics_examples);
  }
};

int run_characteristics(const characteristics_options& options, const context& ctx) {
  const bytes blob = options.key.read();
  tee_link tee(ctx);
  const authorizations list = client::get_characteristics(tee.ta(), blob, options.key.app.given());
  tell(ctx,
       fmt::format("{}: {} key, blob of {}\n{}", options.key.path, key_title(list), format_size(blob.size()),
                   describe_text(list)),
       {{"blob", options.key.path}, {"size", blob.size()}, {"characteristics", describe_json(list)}});
  return exit_done;
}

struct delete_options {
  std::string path;

  void add_to(command_line& command) {
    command.add_option("BLOB", path, "sealed key").required().type_name("");
    command.footer(delete_examples);
  }
};

int run_delete(const delete_options& options, const context& ctx) {
  if (options.path == "-") {
    throw usage_error("only a file can be deleted", "name the blob's file");
  }
  input_file file(options.path);
  const bytes blob = read_small_file(file, "key blob");
  tee_link tee(ctx);
  client::delete_key(tee.ta(), blob);
  if (!file.still_named()) {
    throw failure_error(fmt::format("{} is another file now, and was not removed", options.path),
                        "look at it, and delete it if you mean it");
  }
  if (::unlink(options.path.c_str()) != 0) {
    refuse_file("remove", options.path, errno);
  }
  tell(ctx, fmt::format("The TA agreed, and {} is removed. Copies of it would still work.", options.path),
       {{"deleted", options.path}});
  return exit_done;
}

struct delete_all_options {
  void add_to(command_line& command) { command.footer(delete_all_examples); }
};

int run_delete_all(const delete_all_options& /*options*/, const context& ctx) {
  tee_link tee(ctx);
  client::delete_all_keys(tee.ta());
  tell(ctx, "The TA agreed. It keeps nothing per key; blobs in files are untouched.", {{"deleted", "all"}});
  return exit_done;
}

}  // namespace

void define_export(command_line& command, context& ctx) {
  define<export_options>(command, ctx, run_export);
}

void define_characteristics(command_line& command, context& ctx) {
  define<characteristics_options>(command, ctx, run_characteristics);
}

void define_delete(command_line& command, context& ctx) {
  define<delete_options>(command, ctx, run_delete);
}

void define_delete_all(command_line& command, context& ctx) {
  define<delete_all_options>(command, ctx, run_delete_all);
}

}  // namespace kmctl
