// What went wrong with a command, on both levels that the protocol keeps apart.
#ifndef KEYMASTER_CLIENT_LIB_ERROR_H_
#define KEYMASTER_CLIENT_LIB_ERROR_H_

#include <cstdint>
#include <stdexcept>
#include <string>

namespace keymaster::client {

enum class error_kind {
  connection,  ///< no context or no session could be opened
  tee,         ///< the request was not carried out: the TEE result says why
  keymaster,   ///< the request was carried out and refused: the Keymaster error says why
  soter,       ///< an attestation command was carried out and refused: the status says why
  companion,   ///< another TA than the Keymaster TA did not do what was asked: the TEE result says why
};

/// The facts of one failure. `step` is the command's name, "connect", "open_session", or "open_" and the name of
/// another TA than the Keymaster TA.
struct failure {
  error_kind kind;
  std::string step;
  std::uint32_t tee_result = 0;
  std::uint32_t tee_origin = 0;
  std::int32_t keymaster_error = 0;
  std::int32_t soter_status = 0;  ///< of soter_status_t, or a Keymaster error
  std::uint32_t wait_ms = 0;      ///< for how long the TA refuses this, when it says so
};

/// Thrown by every call of this library that the TEE or the TA refuses. what() names the step and what both levels say;
/// hint() says what to try.
class error : public std::runtime_error {
 public:
  explicit error(failure facts);

  [[nodiscard]] const failure& facts() const { return facts_; }
  [[nodiscard]] error_kind kind() const { return facts_.kind; }
  [[nodiscard]] const std::string& hint() const { return hint_; }

 private:
  failure facts_;
  std::string hint_;
};

/// hint_for looks a failure up in the table of advice. What is not in there can be found in the trace, and it says so.
[[nodiscard]] std::string hint_for(const failure& facts);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_ERROR_H_
