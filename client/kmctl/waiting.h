// The time that wrong passwords cost.
#ifndef KEYMASTER_CLIENT_KMCTL_WAITING_H_
#define KEYMASTER_CLIENT_KMCTL_WAITING_H_

#include <chrono>
#include <thread>

#include "client/kmctl/command_line.h"
#include "client/kmctl/progress.h"
#include "client/lib/error.h"

namespace kmctl {

/// --wait: whether the user sits the time out. It passes while the secure world runs, and that ends with the command.
class waiting_option {
 public:
  option add_to(command_line& command) {
    return command.add_flag("--wait", wait_, "sit out the time that wrong passwords cost, instead of failing");
  }

  /// around makes `attempt`, and with --wait makes it again when the TA says for how long it refuses. Throws what
  /// `attempt` throws otherwise.
  template <class Attempt>
  auto around(const Attempt& attempt) const {
    while (true) {
      try {
        return attempt();
      } catch (const keymaster::client::error& refused) {
        if (!wait_ || refused.facts().wait_ms == 0) {
          throw;
        }
        const spinner alive("Waiting, as wrong passwords make it");
        std::this_thread::sleep_for(std::chrono::milliseconds(refused.facts().wait_ms));
      }
    }
  }

 private:
  bool wait_ = false;
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_WAITING_H_
