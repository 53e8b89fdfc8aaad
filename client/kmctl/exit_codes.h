// The exit codes of kmctl, and the exceptions that stand for those of them that are not the TEE's or the TA's.
#ifndef KEYMASTER_CLIENT_KMCTL_EXIT_CODES_H_
#define KEYMASTER_CLIENT_KMCTL_EXIT_CODES_H_

#include <exception>
#include <stdexcept>
#include <string>

namespace kmctl {

enum exit_code : int {
  exit_done = 0,
  exit_failure = 1,        ///< a file can't be read or written, a key file isn't one, …
  exit_usage = 2,          ///< the command line doesn't make sense
  exit_tee_error = 3,      ///< the TEE or a TA did not carry out the request
  exit_keymaster = 4,      ///< the TA carried it out and refused
  exit_no_connection = 5,  ///< no TEE, or no session with a TA
  exit_invalid = 6,        ///< a signature, MAC or tag does not belong to the data, or a statement is refused
};

/// The codes as `kmctl --help` lists them.
inline constexpr const char* exit_code_help =
    "Exit codes:\n"
    "  0  done\n"
    "  1  failure (a file, a key file, the system)\n"
    "  2  wrong usage\n"
    "  3  TEE error: the request was not carried out\n"
    "  4  Keymaster error: the request was carried out and refused\n"
    "  5  no connection to a TEE, or no session with a TA\n"
    "  6  signature, MAC, tag or statement invalid\n";

/// The command line doesn't make sense. `hint` says what would.
class usage_error : public std::runtime_error {
 public:
  explicit usage_error(const std::string& what, std::string hint = {})
      : std::runtime_error(what), hint_(std::move(hint)) {}
  [[nodiscard]] const std::string& hint() const { return hint_; }

 private:
  std::string hint_;
};

/// The work can't be done for a reason that lies on this side of the TEE.
class failure_error : public std::runtime_error {
 public:
  explicit failure_error(const std::string& what, std::string hint = {})
      : std::runtime_error(what), hint_(std::move(hint)) {}
  [[nodiscard]] const std::string& hint() const { return hint_; }

 private:
  std::string hint_;
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_EXIT_CODES_H_
