// The openssl command, as a second opinion that shares nothing with the TA.
#ifndef KEYMASTER_CLIENT_KMCTL_OPENSSL_COMMAND_H_
#define KEYMASTER_CLIENT_KMCTL_OPENSSL_COMMAND_H_

#include <string>
#include <vector>

namespace kmctl {

struct command_result {
  int status;          ///< the exit code; 128 + n when signal n ended it
  std::string output;  ///< what it printed, standard output and error together
};

/// run_command starts a program of the PATH, waits for its end and gives what it printed. Throws failure_error when it
/// can't be started.
[[nodiscard]] command_result run_command(const std::vector<std::string>& words);

/// shell_words gives the words as a person would type them in a shell.
[[nodiscard]] std::string shell_words(const std::vector<std::string>& words);

/// verify_command gives the words that check a signature over SHA-256 with openssl: RSA PKCS#1 v1.5 or EC.
[[nodiscard]] std::vector<std::string> verify_command(const std::string& public_key, const std::string& signature,
                                                      const std::string& file);

/// mac_command gives the words that make a file's HMAC-SHA-256 with a key in hexadecimal.
[[nodiscard]] std::vector<std::string> mac_command(const std::string& key, const std::string& file);

/// oaep_command gives the words that encrypt a file with RSA-OAEP over SHA-256 for the TA, whose OAEP has MGF1 on SHA-1
/// whatever the digest.
[[nodiscard]] std::vector<std::string> oaep_command(const std::string& public_key, const std::string& secret,
                                                    const std::string& ciphertext);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_OPENSSL_COMMAND_H_
