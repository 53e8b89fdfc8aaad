#include "tests/support/eventually.h"

#include <chrono>
#include <thread>

namespace testing_support {

bool eventually(const std::function<bool()>& holds) {
  using namespace std::chrono_literals;
  const auto end = std::chrono::steady_clock::now() + 10s;
  while (!holds()) {
    if (std::chrono::steady_clock::now() > end) return false;
    std::this_thread::sleep_for(5ms);
  }
  return true;
}

}  // namespace testing_support
