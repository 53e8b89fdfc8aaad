#include "tee/socket/patience.h"

#include <algorithm>
#include <atomic>
#include <thread>

namespace hosted_tee {
namespace {

std::atomic<unsigned> watchers{0};

unsigned most_watchers() {
  static const unsigned most = std::min(std::thread::hardware_concurrency() / 2, 4U);
  return most;
}

}  // namespace

patience::watchers_place::watchers_place() : is_taken_(watchers.fetch_add(1) < most_watchers()) {}

patience::watchers_place::~watchers_place() {
  --watchers;
}

bool patience::is_possible() {
  return most_watchers() != 0;
}

bool patience::begin() {
  if (!is_possible()) return false;
  if (left_ == 0) return true;
  --left_;
  return false;
}

void patience::give_up() {
  left_ = skips_;
  skips_ = std::clamp(skips_ * 2, 1U, most_skips);
}

void patience::let_others_run() {
  std::this_thread::yield();
}

}  // namespace hosted_tee
