#include "tests/kills/kill_stage.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>

#include "tests/kills/kill_plan.h"

namespace hosted_tee::testing {

void give_up(const std::string& what) {
  (void)std::fprintf(stderr, "%s: the test ends here (%s)\n", what.c_str(),
                     kill_plan::from_environment().text().c_str());
  std::_Exit(EXIT_FAILURE);
}

void kill_stage::begin_life() {
  const std::scoped_lock lock(mutex_);
  ++life_;
  left_ = resting_ = 0;
  doomed_ = over_ = asks_for_rest_ = false;
  begun_.fill(0);
  changed_.notify_all();
}

template <class Condition>
void kill_stage::wait_for(const char* what, const teed_process& server, Condition&& holds) {
  const auto limit = std::chrono::steady_clock::now() + ample_time;
  std::unique_lock lock(mutex_);
  while (!changed_.wait_for(lock, std::chrono::milliseconds(20), holds)) {
    if (server.has_ended()) {
      ADD_FAILURE() << "the server has ended by itself: " << server.said();
      return;
    }
    if (::testing::Test::HasFailure()) return;  // a client may have left for that
    if (std::chrono::steady_clock::now() > limit) give_up(what);
  }
}

void kill_stage::wait_for_steps(client_step kind, unsigned count, const teed_process& server) {
  const unsigned& begun = begun_.at(static_cast<std::size_t>(kind));
  wait_for("clients get no answers", server, [&] { return begun >= count; });
}

void kill_stage::rest(const teed_process& server) {
  {
    const std::scoped_lock lock(mutex_);
    asks_for_rest_ = true;
  }
  wait_for("clients don't come to rest", server, [&] { return resting_ == clients_; });
}

void kill_stage::doom() {
  const std::scoped_lock lock(mutex_);
  doomed_ = true;
}

void kill_stage::end_life() {
  std::unique_lock lock(mutex_);
  over_ = true;
  changed_.notify_all();
  if (!changed_.wait_for(lock, ample_time, [&] { return left_ == clients_; })) {
    give_up("a client hangs although its server is gone");
  }
}

void kill_stage::end_all() {
  const std::scoped_lock lock(mutex_);
  ended_ = true;
  changed_.notify_all();
}

unsigned kill_stage::next_life(unsigned last) {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [&] { return ended_ || life_ != last; });
  return ended_ ? 0 : life_;
}

void kill_stage::leave() {
  const std::scoped_lock lock(mutex_);
  ++left_;
  changed_.notify_all();
}

void kill_stage::begin(client_step kind) {
  const std::scoped_lock lock(mutex_);
  ++begun_.at(static_cast<std::size_t>(kind));
  changed_.notify_all();
}

void kill_stage::rest_if_asked() {
  std::unique_lock lock(mutex_);
  if (!asks_for_rest_) return;
  ++resting_;
  changed_.notify_all();
  changed_.wait(lock, [&] { return over_; });
}

bool kill_stage::is_doomed() const {
  const std::scoped_lock lock(mutex_);
  return doomed_;
}

bool kill_stage::is_over() const {
  const std::scoped_lock lock(mutex_);
  return over_;
}

void kill_stage::note_cut(const std::string& command) {
  const std::scoped_lock lock(mutex_);
  ++cuts_[command];
}

std::map<std::string, unsigned> kill_stage::cuts() const {
  const std::scoped_lock lock(mutex_);
  return cuts_;
}

}  // namespace hosted_tee::testing
