// A command that a test keeps from ending.
#ifndef TESTS_REMOTE_HELD_COMMAND_H_
#define TESTS_REMOTE_HELD_COMMAND_H_

#include <future>

#include "tests/tee/scripted_ta.h"

namespace hosted_tee::testing {

/// A command of a scripted TA that runs until it is let go.
class held_command {
 public:
  explicit held_command(ta_script& script) {
    script.invoke = [this](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
      begun_.set_value();
      may_end_.get_future().wait();
      return TEE_SUCCESS;
    };
  }
  void wait_until_it_runs() { begun_.get_future().wait(); }
  void let_go() { may_end_.set_value(); }

 private:
  std::promise<void> begun_, may_end_;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_REMOTE_HELD_COMMAND_H_
