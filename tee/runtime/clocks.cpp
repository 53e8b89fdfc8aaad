#include "tee/runtime/clocks.h"

#include <chrono>

namespace hosted_tee {
namespace {

constexpr std::uint64_t start_of_system_time_ms = std::uint64_t{2} * 3600 * 1000;

template <class Clock>
std::uint64_t now_ms() {
  const auto since_epoch = Clock::now().time_since_epoch();
  return static_cast<std::uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(since_epoch).count());
}

std::uint64_t to_ms(TEE_Time time) {
  return std::uint64_t{time.seconds} * 1000 + time.millis;
}

TEE_Time from_ms(std::uint64_t ms) {
  return {static_cast<std::uint32_t>(ms / 1000), static_cast<std::uint32_t>(ms % 1000)};
}

}  // namespace

clocks::clocks() : start_ms_(now_ms<std::chrono::steady_clock>()) {}

TEE_Time clocks::system() const {
  if (frozen_system_) return *frozen_system_;
  return from_ms(now_ms<std::chrono::steady_clock>() - start_ms_ + start_of_system_time_ms);
}

TEE_Time clocks::ree() const {
  return frozen_ree_ ? *frozen_ree_ : from_ms(now_ms<std::chrono::system_clock>());
}

void clocks::advance(std::uint64_t millis) {
  frozen_system_ = from_ms(to_ms(system()) + millis);
  frozen_ree_ = from_ms(to_ms(ree()) + millis);
}

}  // namespace hosted_tee
