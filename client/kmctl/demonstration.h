// What the rounds of kmctl demo share: a device, a file, a folder, and steps that are told as they are done.
#ifndef KEYMASTER_CLIENT_KMCTL_DEMONSTRATION_H_
#define KEYMASTER_CLIENT_KMCTL_DEMONSTRATION_H_

#include <array>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "client/kmctl/context.h"
#include "client/kmctl/files.h"
#include "client/kmctl/key_use.h"
#include "client/kmctl/output_file.h"
#include "client/lib/keys.h"

namespace kmctl {

/// Everything that the rounds leave in the folder.
inline constexpr std::array demo_files{
    "key.blob",          "public.pem", "signature.bin",  "ec.blob",       "ec-public.pem", "ec-signature.bin",
    "hmac.blob",         "mac.bin",    "aes.blob",       "file.enc",      "oaep.blob",     "oaep-public.pem",
    "secret.bin",        "secret.enc", "attk.pem",       "app.blob",      "app.statement", "app-statement.json",
    "app-statement.sig", "auth.blob",  "auth.statement", "sign.statement"};

/// Carries out steps one after the other, tells each with its time, and keeps what a program may want to read.
class demonstration {
 public:
  /// `folder` gets what the rounds leave; with `force` it may replace what an earlier demo left there. Throws
  /// failure_error when something of these names is there without that, and usage_error when `file` is.
  demonstration(const context& ctx, std::string file, std::filesystem::path folder, bool force);

  [[nodiscard]] keymaster::client::connection& tee() { return tee_.connection(); }
  [[nodiscard]] keymaster::client::session& ta() { return tee_.ta(); }
  [[nodiscard]] const std::string& tee_name() const { return tee_.name(); }
  [[nodiscard]] const std::string& file() const { return file_; }
  [[nodiscard]] std::string path(const char* name) const { return (folder_ / name).string(); }
  [[nodiscard]] const json& steps() const { return steps_; }

  /// say prints a text, unless the answer is to be JSON.
  void say(const std::string& text) const;

  /// step does `work`, which gives what there is to tell, and prints it under a number, `title` and the time it took.
  /// `name` stands for the step in JSON.
  void step(const char* name, const char* title, const std::function<std::string()>& work);

  /// generate makes a key, with a sign of life, and leaves its blob in the folder.
  [[nodiscard]] bytes generate(const char* name, const keymaster::client::authorizations& description);

  /// keep_blob and keep leave a file in the folder.
  void keep_blob(const char* name, byte_view blob) const { write_file(path(name), blob, rules(0600)); }
  void keep(const char* name, byte_view content) const { write_file(path(name), content, rules()); }
  /// rules says how a file of the folder is written.
  [[nodiscard]] output_rules rules(mode_t mode = 0666) const { return {.existing = existing_, .mode = mode}; }
  /// export_public leaves a key's public part as PEM.
  void export_public(const char* name, keymaster::keymaster_algorithm_t algorithm, byte_view blob);

  /// by_openssl runs an openssl command and gives it, as a person would type it, with the first line that it printed.
  /// Throws failure_error when it fails: `what` is what openssl then did not do.
  [[nodiscard]] static std::string by_openssl(const std::vector<std::string>& words, const char* what);

  /// refused makes an attempt that must be refused. Throws failure_error when `what` is accepted, and what the attempt
  /// throws when it is refused for another reason.
  [[nodiscard]] static std::string refused(const char* what, const std::function<void()>& attempt,
                                           const std::function<bool(const keymaster::client::failure&)>& as_it_must);

 private:
  const context& ctx_;
  std::string file_;
  std::filesystem::path folder_;
  overwrite existing_;
  tee_link tee_;
  json steps_ = json::array();
};

/// Everything of a file, with one bit flipped: the first one of the byte at `offset`, or of the file's last byte where
/// it is shorter. An empty file gets one more byte.
class tampered_file {
 public:
  explicit tampered_file(const std::string& path, std::uint64_t offset = 0);
  [[nodiscard]] data_stream data();

 private:
  std::size_t read(std::span<std::uint8_t> buffer);

  input_file file_;
  std::uint64_t left_;  ///< until the byte
  bool tampered_ = false;
};

/// is_wrong_signature tells whether the TA found a signature, MAC or tag wrong.
[[nodiscard]] bool is_wrong_signature(const keymaster::client::failure& facts);

// The rounds, one for each family and use. Each throws when something does not come out as it must.
void show_rsa_signature(demonstration& demo);
void show_ec_signature(demonstration& demo);
void show_mac(demonstration& demo);
void show_file_encryption(demonstration& demo);
void show_secret_transport(demonstration& demo);
void show_attestation(demonstration& demo);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_DEMONSTRATION_H_
