// What every sub-command shares: the options in front of all of them, the way to the TEE, and how results are told.
#ifndef KEYMASTER_CLIENT_KMCTL_CONTEXT_H_
#define KEYMASTER_CLIENT_KMCTL_CONTEXT_H_

#include <exception>
#include <functional>
#include <nlohmann/json.hpp>
#include <string>

#include "client/lib/session.h"

namespace kmctl {

using json = nlohmann::ordered_json;

/// The options of kmctl itself, and where the command's result is left for main.
struct context {
  std::string tee;    ///< --tee NAME
  std::string state;  ///< --state FOLDER
  bool json_output = false;
  int exit = 0;
  std::function<bool()> data_on_stdout;  ///< whether the command's data goes to standard output; empty: it has none
};

/// tee_name chooses the TEE: --tee, --state, the environment's KEYMASTER_TEE, its KEYMASTER_STATE, and last the folder
/// "keymaster" below XDG_STATE_HOME or ~/.local/state. Throws failure_error when there is no home folder either.
[[nodiscard]] std::string tee_name(const context& ctx);

/// A session with the TA, and the connection it runs on.
class tee_link {
 public:
  explicit tee_link(const context& ctx);
  [[nodiscard]] keymaster::client::connection& connection() { return connection_; }
  [[nodiscard]] keymaster::client::session& ta() { return session_; }
  [[nodiscard]] const std::string& name() const { return name_; }

 private:
  std::string name_;
  keymaster::client::connection connection_;
  keymaster::client::session session_;
};

/// tell prints a command's result, as text or as one JSON object: to standard output, or to standard error when the
/// command's data goes to standard output. An empty text prints nothing. Throws failure_error when standard output
/// doesn't take it.
void tell(const context& ctx, const std::string& text, const json& object);

/// tell_failure prints what went wrong, and what to try, to standard error. With --json it is an object, and goes where
/// a result would go.
void tell_failure(const context& ctx, const std::exception& failed);

/// tell_failure_json prints such an object. Standard error gets what standard output doesn't take: the failure and its
/// exit code come before that.
void tell_failure_json(const context& ctx, const json& object);

/// failure_json gives the same as an object, for commands that tell more beside it.
[[nodiscard]] json failure_json(const std::exception& failed);

/// exit_code_of gives the exit code that stands for an exception.
[[nodiscard]] int exit_code_of(const std::exception& failed);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_CONTEXT_H_
