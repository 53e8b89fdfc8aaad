// kmctl demo: the system's main job, step by step, on a file of the user's.
#include <fmt/format.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <utility>

#include "client/kmctl/commands.h"
#include "client/kmctl/describe.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/openssl_command.h"
#include "client/kmctl/progress.h"
#include "client/kmctl/signing.h"
#include "client/kmctl/values.h"
#include "client/lib/key_material.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;
namespace fs = std::filesystem;
using client::authorizations;

constexpr const char* examples =
    "Makes an RSA-2048 key, signs FILE with it, has the TA and openssl verify the signature, and shows that a changed\n"
    "file and a changed blob are refused. Ends with an exit code other than 0 when any of this does not come out.\n\n"
    "Examples:\n"
    "  kmctl demo\n"
    "  kmctl demo letter.txt\n"
    "  kmctl demo -o shown letter.txt     key, signature and public key stay in the folder `shown`\n";

struct demo_options {
  std::string file;
  std::string folder;
  bool force = false;

  void add_to(CLI::App& command) {
    command.add_option("FILE", file, "file to sign (default: this program)")->type_name("");
    command.add_option("-o,--output", folder, "folder for key, signature and public key (default: a new one in /tmp)")
        ->type_name("FOLDER");
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

/// Everything of a file, with its first bit flipped; an empty file gets one more byte.
class tampered_file {
 public:
  explicit tampered_file(const std::string& path) : file_(path) {}

  std::size_t read(std::span<std::uint8_t> buffer) {
    const std::size_t filled = file_.read(buffer);
    if (std::exchange(tampered_, true)) {
      return filled;
    }
    buffer[0] = filled == 0 ? 0x21 : buffer[0] ^ 1U;
    return std::max<std::size_t>(filled, 1);
  }
  [[nodiscard]] data_stream data() {
    return {.read = [this](std::span<std::uint8_t> buffer) { return read(buffer); }, .total = file_.size()};
  }

 private:
  input_file file_;
  bool tampered_ = false;
};

/// Carries out the steps one after the other, with their times, and keeps what a program may want to read.
class demonstration {
 public:
  demonstration(const context& ctx, const demo_options& options)
      : ctx_(ctx),
        file_(file_of(options).string()),
        folder_(folder_of(options)),
        blob_rules_{.existing = options.force ? overwrite::always : overwrite::never, .mode = 0600},
        tee_(ctx) {
    check_output(blob_path(), blob_rules_);
  }

  void run() {
    say(fmt::format("Keymaster on {}\nFile: {} ({})", tee_.name(), file_, format_size(fs::file_size(file_))));
    step("generate", "Generate an RSA-2048 key inside the TEE", [this] { return generate(); });
    step("export", "Export its public part", [this] { return export_public(); });
    step("sign", "Sign the file", [this] { return sign(); });
    step("verify", "Verify the signature in the TA", [this] { return verify(); });
    step("openssl", "Verify it with openssl, which knows nothing of the TEE", [this] { return verify_with_openssl(); });
    step("tampered_file", "Flip one bit of the file: the TA must refuse the signature",
         [this] { return refuse_tampered_file(); });
    step("tampered_blob", "Flip one bit of the key blob: the TA must refuse the key",
         [this] { return refuse_tampered_blob(); });
    finish();
  }

 private:
  [[nodiscard]] std::string blob_path() const { return (folder_ / "key.blob").string(); }
  [[nodiscard]] std::string public_path() const { return (folder_ / "public.pem").string(); }
  [[nodiscard]] std::string signature_path() const { return (folder_ / "signature.bin").string(); }

  void say(const std::string& text) const {
    if (!ctx_.json_output) {
      fmt::print("{}\n", text);
      (void)std::fflush(stdout);
    }
  }

  void step(const char* name, const char* title, const std::function<std::string()>& work) {
    const auto start = std::chrono::steady_clock::now();
    const std::string told = work();
    const std::chrono::duration<double, std::milli> took = std::chrono::steady_clock::now() - start;
    steps_.push_back({{"step", name}, {"milliseconds", took.count()}, {"result", told}});
    say(fmt::format("\n{}. {} ({:.{}f} ms)\n{}", steps_.size(), title, took.count(), took.count() < 1 ? 2 : 0, told));
  }

  [[nodiscard]] signing_key key(byte_view blob) const {
    return {
        .blob = blob,
        .app = {},
        .parameters =
            authorizations{}.padding({keymaster::KM_PAD_RSA_PKCS1_1_5_SIGN}).digest({keymaster::KM_DIGEST_SHA_2_256}),
        .each_step = {}};
  }

  std::string generate() {
    {
      const spinner alive("Generating");
      blob_ = client::generate_key(tee_.ta(), authorizations{}
                                                  .algorithm(keymaster::KM_ALGORITHM_RSA)
                                                  .key_size(2048)
                                                  .rsa_public_exponent(65537)
                                                  .purpose({keymaster::KM_PURPOSE_SIGN, keymaster::KM_PURPOSE_VERIFY})
                                                  .digest({keymaster::KM_DIGEST_SHA_2_256})
                                                  .padding({keymaster::KM_PAD_RSA_PKCS1_1_5_SIGN})
                                                  .no_auth_required());
    }
    write_file(blob_path(), blob_, blob_rules_);
    const authorizations characteristics = client::get_characteristics(tee_.ta(), blob_);
    return fmt::format(
        "   Outside the TEE the key exists only as this sealed blob of {}: {}\n   What it may be used for:\n{}",
        format_size(blob_.size()), blob_path(), describe_text(characteristics, 5));
  }

  std::string export_public() {
    const std::string pem = client::public_key_pem(keymaster::KM_ALGORITHM_RSA, client::export_key(tee_.ta(), blob_));
    write_file(public_path(), client::as_bytes(pem), {});
    return fmt::format("   {}", public_path());
  }

  std::string sign() {
    input_file file(file_);
    signature_ = sign_stream(tee_.ta(), key(blob_), data_of(file));
    write_file(signature_path(), signature_, {});
    return fmt::format("   {} of signature: {}", format_size(signature_.size()), signature_path());
  }

  std::string verify() {
    input_file file(file_);
    verify_stream(tee_.ta(), key(blob_), data_of(file), signature_);
    return "   The signature is valid.";
  }

  std::string verify_with_openssl() {
    const auto words = verify_command(public_path(), signature_path(), file_);
    const command_result result = run_command(words);
    if (result.status != 0) {
      throw failure_error(fmt::format("openssl did not accept the signature: {}", result.output));
    }
    return fmt::format("   $ {}\n   {}", command_line(words), result.output.substr(0, result.output.find('\n')));
  }

  /// The refusal is the result that is wanted here: anything else is a failure of the demo.
  static std::string refused(const char* what, const std::function<void()>& attempt,
                             const std::function<bool(const client::failure&)>& as_it_must) {
    try {
      attempt();
    } catch (const client::error& refusal) {
      if (as_it_must(refusal.facts())) {
        return fmt::format("   Refused, as it must be: {}", refusal.what());
      }
      throw;
    }
    throw failure_error(fmt::format("the TA accepted {}", what));
  }

  std::string refuse_tampered_file() {
    return refused(
        "a changed file",
        [this] {
          tampered_file file(file_);
          verify_stream(tee_.ta(), key(blob_), file.data(), signature_);
        },
        [](const client::failure& facts) {
          return facts.keymaster_error == keymaster::KM_ERROR_VERIFICATION_FAILED && facts.tee_result == TEEC_SUCCESS;
        });
  }

  std::string refuse_tampered_blob() {
    return refused(
        "a changed blob",
        [this] {
          bytes changed = blob_;
          changed[changed.size() / 2] ^= 1U;
          (void)client::operation::begin(tee_.ta(), keymaster::KM_PURPOSE_SIGN, changed, key(changed).parameters);
        },
        [](const client::failure& facts) {
          return client::tee_result_name(facts.tee_result) == "TEE_ERROR_MAC_INVALID";
        });
  }

  void finish() const {
    const std::string repeat = command_line(verify_command(public_path(), signature_path(), file_));
    const std::string inspect = command_line({"openssl", "pkey", "-pubin", "-in", public_path(), "-text", "-noout"});
    say(fmt::format("\nEverything came out as it must. To check it yourself:\n  {}\n  {}", repeat, inspect));
    if (ctx_.json_output) {
      tell(ctx_, {},
           {{"tee", tee_.name()},
            {"file", file_},
            {"blob", blob_path()},
            {"public_key", public_path()},
            {"signature", signature_path()},
            {"steps", steps_},
            {"commands", {repeat, inspect}}});
    }
  }

  const context& ctx_;
  std::string file_;
  fs::path folder_;
  output_rules blob_rules_;
  tee_link tee_;
  bytes blob_;
  bytes signature_;
  json steps_ = json::array();
};

int run_demo(const demo_options& options, const context& ctx) {
  demonstration(ctx, options).run();
  return exit_done;
}

}  // namespace

void define_demo(CLI::App& command, context& ctx) {
  define<demo_options>(command, ctx, run_demo);
}

}  // namespace kmctl
