// kmctl generate and kmctl import: from nothing, or from a key file, to a sealed blob.
#include <fmt/format.h>

#include <chrono>
#include <optional>
#include <vector>

#include "client/kmctl/authorization_options.h"
#include "client/kmctl/commands.h"
#include "client/kmctl/describe.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/password.h"
#include "client/kmctl/progress.h"
#include "client/kmctl/values.h"
#include "client/lib/key_material.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::authorizations;

constexpr const char* generate_examples =
    "What is left out is filled in: an RSA-2048 key for PKCS#1 v1.5 signatures over SHA-256, or with --algorithm an "
    "EC\n"
    "key on P-256 (--size chooses the curve), an AES-256 key for gcm, a 256-bit HMAC key for SHA-256. An RSA key "
    "encrypts\n"
    "when its purposes or paddings say so.\n"
    "Dates are ISO 8601, UTC without an offset: 2030-01-31, 2030-01-31T12:00:00+02:00.\n\n"
    "Examples:\n"
    "  kmctl generate key.blob\n"
    "  kmctl generate --size 4096 --padding pss --digest sha-256,sha-512 key.blob\n"
    "  kmctl generate --padding oaep rsa.blob\n"
    "  kmctl generate --algorithm ec --size 384 --digest sha-384 ec.blob\n"
    "  kmctl generate --algorithm aes --block-mode cbc,ctr aes.blob\n"
    "  kmctl generate --algorithm hmac --min-mac-length 128 hmac.blob\n"
    "  kmctl generate --app-id my.app --app-data hex:00ff17 key.blob\n"
    "  kmctl generate --active 2030-01-01 --origination-expire 2031-01-01 key.blob\n"
    "  kmctl generate --soter --counted --uid 1000 app.blob\n"
    "  kmctl generate --soter --signed-by app.blob --counted --uid 1000 --user-secure-id 1234567890 \\\n"
    "        --user-auth-type fingerprint auth.blob\n"
    "  kmctl generate - > key.blob\n";

constexpr const char* import_examples =
    "FILE is a private RSA or EC key as openssl writes it: PEM or DER, PKCS#8, PKCS#1 or SEC 1, encrypted or not. "
    "With\n"
    "--algorithm aes or hmac its bytes are the key. Size and exponent are those of the key.\n\n"
    "Examples:\n"
    "  openssl genrsa -out private.pem 2048\n"
    "  kmctl import private.pem key.blob\n"
    "  kmctl import --algorithm aes --block-mode cbc raw.key aes.blob\n"
    "  kmctl import --passphrase @secret.txt --padding pss encrypted.pem key.blob\n";

constexpr mode_t blob_mode = 0600;

/// The blob is the only copy of its key, and only its owner can read it.
struct blob_output {
  std::string path;
  bool force = false;

  option add_to(command_line& command) {
    command.add_flag("--force", force, "overwrite an existing file");
    return command.add_option("BLOB", path, "file for the sealed blob, - for standard output").required().type_name("");
  }
  [[nodiscard]] output_rules rules() const {
    return {.existing = force ? overwrite::always : overwrite::never, .mode = blob_mode};
  }
  void check(std::vector<std::string> inputs, const application_options& app) const {
    inputs.insert(inputs.end(), app.files().begin(), app.files().end());
    refuse_overwriting(path, inputs);
    check_binary_output(path, rules());
  }
};

struct generate_options {
  authorization_options description;
  application_options app;
  blob_output out;
  option data_option;

  void add_to(command_line& command) {
    description.add_to(command, option_use::generate);
    app.add_to(command);
    data_option = out.add_to(command);
    command.footer(generate_examples);
  }
};

struct import_options {
  authorization_options description;
  application_options app;
  blob_output out;
  std::string file;
  std::optional<std::string> passphrase;
  option data_option;

  void add_to(command_line& command) {
    description.add_to(command, option_use::import);
    app.add_to(command);
    command.add_option("FILE", file, "private key, - for standard input").required().type_name("");
    data_option = out.add_to(command);
    command
        .add_option("--passphrase", passphrase, "of an encrypted key: @FILE, or as it stands (others can see it there)")
        .type_name("VALUE");
    command.footer(import_examples);
  }
};

void tell_key(const context& ctx, const char* done, const std::string& path, const bytes& blob,
              const authorizations& characteristics, std::chrono::steady_clock::duration took) {
  const double seconds = std::chrono::duration<double>(took).count();
  tell(ctx,
       fmt::format("{} {} key, sealed in {} ({}), {:.2f} s\n{}", done, key_title(characteristics),
                   path == "-" ? "standard output" : path, format_size(blob.size()), seconds,
                   describe_text(characteristics)),
       {{"blob", path},
        {"size", blob.size()},
        {"seconds", seconds},
        {"characteristics", describe_json(characteristics)}});
}

int run_generate(const generate_options& options, const context& ctx) {
  options.out.check(options.description.files(), options.app);
  authorizations description = with_defaults(options.description.given(), option_use::generate);
  const std::string title = key_title(description);
  description.add(options.app.given().tags());

  tee_link tee(ctx);
  const auto start = std::chrono::steady_clock::now();
  client::key_blob blob;
  {
    const spinner alive(fmt::format("Generating the {} key", title));
    blob = client::generate_key(tee.ta(), description);
  }
  const auto took = std::chrono::steady_clock::now() - start;
  const authorizations characteristics = client::get_characteristics(tee.ta(), blob, options.app.given());
  write_binary(options.out.path, blob, options.out.rules());
  tell_key(ctx, "Generated", options.out.path, blob, characteristics, took);
  return exit_done;
}

bool is_raw(std::uint64_t algorithm) {
  return algorithm == keymaster::KM_ALGORITHM_AES || algorithm == keymaster::KM_ALGORITHM_HMAC;
}

/// The passphrase of an encrypted key.
std::optional<secret_bytes> passphrase_of(const import_options& options) {
  if (!options.passphrase) {
    return std::nullopt;
  }
  const auto file = file_of_value(*options.passphrase);
  if (!file) {
    const bytes typed = parse_bytes(*options.passphrase);  // it lies open in the command line anyway
    return secret_bytes(typed.begin(), typed.end());
  }
  return read_password_file(*file);
}

std::vector<std::string> files_of(const import_options& options) {
  std::vector<std::string> files{options.file};
  if (const auto file = file_of_value(options.passphrase.value_or(""))) {
    files.push_back(*file);
  }
  return files;
}

/// Gives the key's material, and adds the algorithm to the description when only the file told it.
secret_bytes material_of(const import_options& options, authorizations& description) {
  const auto stated = description.unique_number(keymaster::KM_TAG_ALGORITHM);
  secret_bytes file = read_secret_file(options.file, "private key");
  if (is_raw(stated.value_or(0))) {
    return file;
  }
  const auto passphrase = passphrase_of(options);
  auto key = client::read_private_key(file, passphrase ? std::optional(client::as_text(*passphrase)) : std::nullopt);
  if (!stated) {
    description.algorithm(key.algorithm);
  } else if (*stated != key.algorithm) {
    throw usage_error(fmt::format("{} holds a key of another algorithm", options.file), "leave --algorithm out");
  }
  return std::move(key.material);
}

int run_import(const import_options& options, const context& ctx) {
  options.out.check(files_of(options), options.app);
  authorizations given = options.description.given();
  const secret_bytes material = material_of(options, given);
  authorizations description = with_defaults(given, option_use::import);
  description.add(options.app.given().tags());

  tee_link tee(ctx);
  const auto start = std::chrono::steady_clock::now();
  const client::imported_key key = client::import_key(tee.ta(), description, material);
  const auto took = std::chrono::steady_clock::now() - start;
  write_binary(options.out.path, key.blob, options.out.rules());
  tell_key(ctx, "Imported", options.out.path, key.blob, key.characteristics, took);
  return exit_done;
}

}  // namespace

void define_generate(command_line& command, context& ctx) {
  define<generate_options>(command, ctx, run_generate);
}

void define_import(command_line& command, context& ctx) {
  define<import_options>(command, ctx, run_import);
}

}  // namespace kmctl
