// kmctl encrypt and kmctl decrypt: files of any size, streamed through the TA.
#include <fmt/format.h>

#include <array>
#include <optional>
#include <string>
#include <vector>

#include "client/kmctl/authorization_options.h"
#include "client/kmctl/ciphering.h"
#include "client/kmctl/commands.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/operation_parameters.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/user_presence.h"
#include "client/kmctl/values.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
using client::byte_view;

constexpr const char* encrypt_examples =
    "Block mode, padding and digest are those of the key when it allows only one of each. The TA draws the nonce, "
    "which\n"
    "is stored in front of the ciphertext; the tag of gcm is at its end. Only gcm notices a changed ciphertext. With "
    "RSA\n"
    "the public part of a key encrypts, as much as fits into it: encrypt the key of something larger.\n\n"
    "Examples:\n"
    "  kmctl generate --algorithm aes aes.blob\n"
    "  kmctl encrypt aes.blob letter.txt -o letter.enc\n"
    "  kmctl encrypt --aad 'to: Mary' aes.blob letter.txt -o letter.enc\n"
    "  tar c folder | kmctl encrypt aes.blob -o folder.enc\n"
    "  kmctl encrypt --nonce-out letter.nonce aes.blob letter.txt -o letter.bare      for scripts\n";

constexpr const char* decrypt_examples =
    "The nonce is taken from the front of the ciphertext. A gcm text is handed out when its tag has proved right and "
    "not\n"
    "before: exit code 6 says that it did not, and nothing was written. (For standard output the text waits in a file\n"
    "without a name below TMPDIR.)\n\n"
    "Examples:\n"
    "  kmctl decrypt aes.blob letter.enc -o letter.txt\n"
    "  kmctl decrypt --aad 'to: Mary' aes.blob letter.enc\n"
    "  kmctl decrypt aes.blob < folder.enc | tar x\n"
    "  kmctl decrypt --raw --nonce @letter.nonce aes.blob letter.bare -o letter.txt\n";

/// A nonce of the command line: hexadecimal digits, with or without hex: in front, or @FILE.
bytes parse_nonce(const std::string& text) {
  return text.starts_with("@") || text.starts_with("hex:") ? parse_bytes(text) : parse_hex(text);
}

struct cipher_options {
  std::string blob;
  std::string file = "-";
  std::string out = "-";
  application_options app;
  authorization_options parameters;
  presence_options presence;
  std::optional<bytes> nonce;
  std::optional<bytes> associated_data;
  bool raw = false;
  option data_option;
  std::vector<std::string> value_files;  ///< the FILEs of values that are @FILE

  static constexpr const char* group = "Nonce and associated data";

  void add_options(command_line& command, const char* file_help, const char* out_help, const char* nonce_help,
                   const char* raw_help) {
    command.add_option("BLOB", blob, "sealed key, - for standard input").required().type_name("");
    command.add_option("FILE", file, file_help).type_name("");
    data_option = command.add_option("-o,--output", out, out_help);
    data_option.type_name("FILE");
    parameters.add_to(command, option_use::cipher);
    add_bytes(command, "--aad", associated_data, parse_bytes,
              "associated data that gcm authenticates with the text: text, hex:00ff17 or @FILE");
    add_bytes(command, "--nonce", nonce, parse_nonce, nonce_help);
    command.add_flag("--raw", raw, raw_help).group(group);
    presence.add_to(command);
    app.add_to(command);
  }

  void add_bytes(command_line& command, const char* flag, std::optional<bytes>& to, bytes (*parse)(const std::string&),
                 const char* help) {
    const auto take = [this, &to, parse](const std::string& text) {
      if (const auto file_name = file_of_value(text)) {
        value_files.push_back(*file_name);
      }
      to = parse(text);
    };
    command.add_option_function(flag, take, help).type_name("VALUE").group(group);
  }

  [[nodiscard]] std::vector<std::string> inputs() const {
    std::vector<std::string> all{blob, file};
    for (const auto& more : {app.files(), parameters.files(), presence.files(), value_files}) {
      all.insert(all.end(), more.begin(), more.end());
    }
    return all;
  }
};

struct encrypt_options : cipher_options {
  std::string nonce_out;

  void add_to(command_line& command) {
    add_options(command, "the text, - for standard input (the default)",
                "file for the ciphertext (default: standard output)",
                "the nonce to use, if the key allows that: hexadecimal digits or @FILE",
                "no nonce in front of the ciphertext; needs --nonce or --nonce-out");
    command.add_option("--nonce-out", nonce_out, "write the nonce there and not in front of the ciphertext")
        .type_name("FILE")
        .group(group);
    command.footer(encrypt_examples);
  }
};

struct decrypt_options : cipher_options {
  void add_to(command_line& command) {
    add_options(command, "the ciphertext, - for standard input (the default)",
                "file for the text (default: standard output)",
                "the nonce of a ciphertext that has none in front: hexadecimal digits or @FILE",
                "the ciphertext has no nonce in front; needs --nonce");
    command.footer(decrypt_examples);
  }
};

void check_files(const cipher_options& options) {
  refuse_shared_inputs(options.inputs());
  refuse_overwriting(options.out, options.inputs());
}

/// What an option asks for and the key's algorithm or block mode does not have: the TA would pass over it in silence.
void check_options_fit(const cipher_options& options, const key_use& key) {
  const auto& given = options.parameters.given();
  const auto mode = key.parameters.unique_number(keymaster::KM_TAG_BLOCK_MODE);
  const bool is_aes = key.algorithm == keymaster::KM_ALGORITHM_AES;
  const bool is_gcm = is_aes && mode == keymaster::KM_MODE_GCM;
  struct row {
    bool given;
    bool fits;
    const char* what;
  };
  const std::array rows = std::to_array<row>({
      {options.associated_data.has_value(), is_gcm, "--aad goes with gcm only"},
      {given.contains(keymaster::KM_TAG_MAC_LENGTH), is_gcm, "--mac-length goes with gcm only"},
      {given.contains(keymaster::KM_TAG_BLOCK_MODE), is_aes, "--block-mode goes with AES keys only"},
      {options.nonce.has_value(), nonce_size(key.parameters) != 0, "this cipher has no nonce"},
  });
  for (const row& one : rows) {
    if (one.given && !one.fits) {
      throw usage_error(one.what, "leave the option out, or choose another block mode or key");
    }
  }
  if (options.nonce && options.nonce->size() != nonce_size(key.parameters)) {
    throw usage_error(
        fmt::format("the nonce has {} bytes and must have {}", options.nonce->size(), nonce_size(key.parameters)),
        "write two hexadecimal digits for each byte, or @FILE");
  }
}

key_use use_of(const cipher_options& options, client::session& ta, keymaster::keymaster_purpose_t purpose,
               byte_view blob, user_presence& user) {
  key_use key = make_key_use(ta, purpose, blob, options.app.given(), options.parameters.given(), &user);
  check_options_fit(options, key);
  if (options.nonce) {
    key.parameters.nonce(*options.nonce);
  }
  return key;
}

/// Counts what passes.
class counted_output {
 public:
  explicit counted_output(output_file& out) : out_(out) {}
  void write(byte_view piece) {
    out_.write(piece);
    size_ += piece.size();
  }
  [[nodiscard]] std::uint64_t size() const { return size_; }

 private:
  output_file& out_;
  std::uint64_t size_ = 0;
};

void tell_output(const context& ctx, const cipher_options& options, const key_use& key, const char* done,
                 std::uint64_t size, json details) {
  json object = {{"output", options.out}, {"size", size}};
  object.update(parameters_json(key));
  object.update(details);
  const std::string text = fmt::format("{}: {} in {} ({})", done, format_size(size), options.out, parameters_text(key));
  tell(ctx, options.out == "-" ? std::string{} : text, object);
}

/// Where the nonce of an encryption goes. What nobody keeps is lost, and the text with it.
void check_nonce_is_kept(const encrypt_options& options, const key_use& key) {
  const bool has_nonce = nonce_size(key.parameters) != 0;
  if (!options.nonce_out.empty() && !has_nonce) {
    throw usage_error("this cipher has no nonce", "leave --nonce-out out");
  }
  if (options.raw && has_nonce && !options.nonce && options.nonce_out.empty()) {
    throw usage_error("nobody would know the nonce, and the ciphertext could not be decrypted",
                      "have it written to a file with --nonce-out, or say with --nonce which one to use");
  }
}

void check_nonce_file(const encrypt_options& options) {
  if (options.nonce_out.empty()) {
    return;
  }
  if (options.nonce_out == options.out || same_file(options.nonce_out, options.out)) {
    throw usage_error("the nonce needs a file of its own", "name another one with --nonce-out");
  }
  refuse_overwriting(options.nonce_out, options.inputs());
  check_binary_output(options.nonce_out, {});
}

int run_encrypt(const encrypt_options& options, const context& ctx) {
  check_files(options);
  check_binary_output(options.out, {});
  check_nonce_file(options);
  const bytes blob = read_small_file(options.blob, "key blob");
  input_file text(options.file);
  tee_link tee(ctx);
  user_presence user(tee.connection(), options.presence);
  const key_use key = use_of(options, tee.ta(), keymaster::KM_PURPOSE_ENCRYPT, blob, user);
  check_nonce_is_kept(options, key);

  output_file out(options.out);
  counted_output ciphertext(out);
  std::optional<output_file> nonce_file;
  if (!options.nonce_out.empty()) {
    nonce_file.emplace(options.nonce_out);
  }
  json nonce_told = json::object();
  const auto take_nonce = [&](byte_view nonce) {
    nonce_told["nonce"] = to_hex(nonce);
    if (nonce_file) {
      nonce_file->write(nonce);
    } else if (!options.raw) {
      ciphertext.write(nonce);
    }
  };
  encrypt_stream(tee.ta(), key, data_of(text), options.associated_data.value_or(bytes{}), take_nonce,
                 [&](byte_view piece) { ciphertext.write(piece); });
  if (nonce_file) {
    nonce_file->commit();
  }
  out.commit();
  tell_output(ctx, options, key, "Ciphertext", ciphertext.size(), nonce_told);
  return exit_done;
}

/// The ciphertext's nonce becomes one of the key's parameters, wherever it comes from.
data_stream ciphertext_of(const decrypt_options& options, input_file& file, key_use& key) {
  data_stream data = data_of(file);
  const std::size_t size = nonce_size(key.parameters);
  if (options.raw && size != 0 && !options.nonce) {
    throw usage_error("a raw ciphertext comes without its nonce", "pass it with --nonce");
  }
  if (!options.raw && options.nonce) {
    throw usage_error("the nonce stands in front of the ciphertext", "leave --nonce out; if it doesn't, add --raw");
  }
  if (!options.raw && size != 0) {
    key.parameters.nonce(take_nonce(data, size, options.file));
  }
  return data;
}

int run_decrypt(const decrypt_options& options, const context& ctx) {
  check_files(options);
  check_output(options.out, {});
  const bytes blob = read_small_file(options.blob, "key blob");
  input_file file(options.file);
  tee_link tee(ctx);
  user_presence user(tee.connection(), options.presence);
  key_use key = use_of(options, tee.ta(), keymaster::KM_PURPOSE_DECRYPT, blob, user);
  const data_stream data = ciphertext_of(options, file, key);

  const bool is_gcm = key.parameters.unique_number(keymaster::KM_TAG_BLOCK_MODE) == keymaster::KM_MODE_GCM;
  output_file out(options.out, {.hold_back = is_gcm});
  counted_output text(out);
  decrypt_stream(tee.ta(), key, data, options.associated_data.value_or(bytes{}),
                 [&](byte_view piece) { text.write(piece); });
  out.commit();
  tell_output(ctx, options, key, "Text", text.size(), json::object());
  return exit_done;
}

}  // namespace

void define_encrypt(command_line& command, context& ctx) {
  define<encrypt_options>(command, ctx, run_encrypt);
}

void define_decrypt(command_line& command, context& ctx) {
  define<decrypt_options>(command, ctx, run_decrypt);
}

}  // namespace kmctl
