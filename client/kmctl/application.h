// The command line of kmctl as a whole.
#ifndef KEYMASTER_CLIENT_KMCTL_APPLICATION_H_
#define KEYMASTER_CLIENT_KMCTL_APPLICATION_H_

#include <memory>

#include "client/kmctl/context.h"

namespace CLI {
class App;
}

namespace kmctl {

/// make_application builds the command line with every sub-command and option, ready to be parsed or to be walked by
/// what writes completions and manual pages. `ctx` must outlive it.
[[nodiscard]] std::unique_ptr<CLI::App> make_application(context& ctx);

/// run parses the command line, does what it says and gives the exit code. Throws nothing.
[[nodiscard]] int run(int argc, const char* const* argv) noexcept;

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_APPLICATION_H_
