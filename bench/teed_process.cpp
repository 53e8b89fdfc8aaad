#include "bench/teed_process.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <stdexcept>
#include <thread>

#include "tee_client_api.h"

namespace bench {
namespace {

using namespace std::chrono_literals;

bool answers(const std::string& name) {
  TEEC_Context context{};
  const bool is_there = TEEC_InitializeContext(name.c_str(), &context) == TEEC_SUCCESS;
  TEEC_FinalizeContext(&context);
  return is_there;
}

}  // namespace

teed_process::teed_process() : socket_((folder_.path() / "teed.sock").string()) {
  const std::string state = (folder_.path() / "state").string();
  process_ = ::fork();
  if (process_ < 0) throw std::runtime_error("fork failed");
  if (process_ == 0) {
    // It says on standard error that it serves, which is nothing to read among figures.
    ::dup2(::open("/dev/null", O_WRONLY | O_CLOEXEC), STDERR_FILENO);
    ::execl(TEED_PROGRAM, "teed", "--state", state.c_str(), "--socket", socket_.c_str(), nullptr);
    ::_exit(127);
  }
  for (int i = 0; i < 500; ++i) {
    if (answers(context_name())) return;
    std::this_thread::sleep_for(20ms);
  }
  throw std::runtime_error("teed does not answer");
}

teed_process::~teed_process() {
  ::kill(process_, SIGTERM);
  ::waitpid(process_, nullptr, 0);
}

}  // namespace bench
