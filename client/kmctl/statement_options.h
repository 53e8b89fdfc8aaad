// What a relying party says of the statement that it expects.
#ifndef KEYMASTER_CLIENT_KMCTL_STATEMENT_OPTIONS_H_
#define KEYMASTER_CLIENT_KMCTL_STATEMENT_OPTIONS_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "client/kmctl/command_line.h"
#include "client/lib/bytes.h"
#include "client/lib/rsa_public_key.h"

namespace kmctl {

/// The options of kmctl statement verify.
struct statement_options {
  std::string statement;
  bool of_export = false;
  bool of_sign = false;
  std::string attk, record, signer;  ///< files with the signer's key; empty: not given
  std::optional<std::string> public_key_out;
  std::optional<keymaster::client::bytes> challenge;
  bool any_finger = false;
  std::vector<std::uint32_t> fingers;
  std::optional<std::uint32_t> uid;
  std::optional<std::uint64_t> last_counter;
  std::string ledger;
  option extra_data_option;

  void add_to(command_line& command);

  /// check refuses options that do not go together, and outputs that could not be written. Throws usage_error,
  /// failure_error.
  void check() const;

  /// scheme gives how a message was signed. Throws usage_error when that can't be.
  [[nodiscard]] keymaster::client::signature_scheme scheme() const;

  /// expected_fingers gives nothing when no finger is asked for, and an empty list when any will do.
  [[nodiscard]] std::optional<std::vector<std::uint32_t>> expected_fingers() const;

 private:
  void add_signer_options(command_line& command);
  void add_message_options(command_line& command);
  void add_memory_options(command_line& command);
  void check_kind() const;
  void check_signer() const;
  void check_files() const;
  [[nodiscard]] std::vector<std::string> inputs() const;

  std::optional<std::uint32_t> padding_;
  std::optional<std::uint32_t> digest_;
  std::vector<std::string> value_files_;
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_STATEMENT_OPTIONS_H_
