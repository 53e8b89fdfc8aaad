// kmctl demo: the system's main job, step by step, on a file of the user's.
#include <fmt/format.h>

#include <array>
#include <cstdlib>
#include <filesystem>

#include "client/kmctl/commands.h"
#include "client/kmctl/demonstration.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/openssl_command.h"
#include "client/kmctl/values.h"

namespace kmctl {
namespace {

namespace fs = std::filesystem;

constexpr const char* examples =
    "One round of each family, on FILE: an RSA-2048 key signs it, the TA and openssl verify the signature, a changed "
    "file\n"
    "and a changed blob are refused; an EC signature and a MAC that openssl checks; the file encrypted with AES-GCM,\n"
    "decrypted, and refused when a bit has changed; a secret that openssl encrypts with RSA-OAEP and the TA decrypts.\n"
    "Last, attestation: the device gets an attestation key unless it has one, vouches for a key, that one for "
    "another,\n"
    "and that one for a challenge which a finger agreed to; a relying party checks the chain. The key, properties "
    "that\n"
    "were missing and one finger stay on the device: name another one with --state to keep yours as it is.\n"
    "Ends with an exit code other than 0 when any of this does not come out.\n\n"
    "Examples:\n"
    "  kmctl demo\n"
    "  kmctl demo letter.txt\n"
    "  kmctl demo -o shown letter.txt     keys, signatures and ciphertexts stay in the folder `shown`\n";

struct demo_options {
  std::string file;
  std::string folder;
  bool force = false;

  void add_to(command_line& command) {
    command.add_option("FILE", file, "file to work on (default: this program)").type_name("");
    command
        .add_option("-o,--output", folder, "folder for keys, signatures and ciphertexts (default: a new one in /tmp)")
        .type_name("FOLDER");
    command.add_flag("--force", force, "overwrite what an earlier demo left in the folder");
    command.footer(examples);
  }
};

fs::path file_of(const demo_options& options) {
  fs::path file = options.file.empty() ? fs::read_symlink("/proc/self/exe") : fs::path(options.file);
  if (!fs::is_regular_file(file)) {
    throw failure_error(fmt::format("{} is not a regular file", file.string()),
                        "the demo reads its file several times, so it can't take a pipe or a folder");
  }
  return file;
}

fs::path folder_of(const demo_options& options) {
  if (!options.folder.empty()) {
    fs::create_directories(options.folder);
    return options.folder;
  }
  std::string name = (fs::temp_directory_path() / "kmctl-demo-XXXXXX").string();
  if (::mkdtemp(name.data()) == nullptr) {
    throw failure_error("can't make a folder below " + fs::temp_directory_path().string());
  }
  return name;
}

constexpr std::array rounds{show_rsa_signature,   show_ec_signature,     show_mac,
                            show_file_encryption, show_secret_transport, show_attestation};

int run_demo(const demo_options& options, const context& ctx) {
  const std::string file = file_of(options).string();
  demonstration demo(ctx, file, folder_of(options), options.force);
  demo.say(fmt::format("Keymaster on {}\nFile: {} ({})", demo.tee_name(), file, format_size(fs::file_size(file))));
  for (void (*const show)(demonstration&) : rounds) {
    show(demo);
  }
  const std::string repeat = shell_words(verify_command(demo.path("public.pem"), demo.path("signature.bin"), file));
  const std::string inspect =
      shell_words({"openssl", "pkey", "-pubin", "-in", demo.path("public.pem"), "-text", "-noout"});
  demo.say(fmt::format("\nEverything came out as it must. To check it yourself:\n  {}\n  {}", repeat, inspect));
  if (ctx.json_output) {
    tell(ctx, {},
         {{"tee", demo.tee_name()},
          {"file", file},
          {"blob", demo.path("key.blob")},
          {"public_key", demo.path("public.pem")},
          {"signature", demo.path("signature.bin")},
          {"steps", demo.steps()},
          {"commands", {repeat, inspect}}});
  }
  return exit_done;
}

}  // namespace

void define_demo(command_line& command, context& ctx) {
  define<demo_options>(command, ctx, run_demo);
}

}  // namespace kmctl
