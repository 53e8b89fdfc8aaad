#include "tee/socket/frame_slot.h"

#include <atomic>
#include <cstring>

namespace hosted_tee {
namespace {

using shared_word = std::atomic_ref<std::uint32_t>;
static_assert(shared_word::is_always_lock_free, "a lock would be each process's own");

constexpr std::uint32_t empty = 0, sleeping = 1, shortest = 2;

constexpr int looks = 4;

void pause() {
#if defined(__x86_64__) || defined(__i386__)
  __builtin_ia32_pause();
#elif defined(__aarch64__) || (defined(__arm__) && __ARM_ARCH >= 7)
  asm volatile("yield");
#endif
}

}  // namespace

frame_slot::handed frame_slot::put(std::span<const std::uint8_t> frame) {
  if (frame.size() < shortest || frame.size() > room_.size()) return handed::in_vain;
  std::memcpy(room_.data(), frame.data(), frame.size());
  switch (shared_word(*word_).exchange(static_cast<std::uint32_t>(frame.size()))) {
    case empty:
      return handed::over;
    case sleeping:
      return handed::to_sleeper;
    default:
      return handed::in_vain;
  }
}

bool frame_slot::watch() const {
  for (int i = 0; i < looks; ++i) {
    if (shared_word(*word_).load(std::memory_order_relaxed) != empty) return true;
    pause();
  }
  return false;
}

bool frame_slot::begin_sleep() {
  std::uint32_t found = empty;
  return shared_word(*word_).compare_exchange_strong(found, sleeping);
}

bool frame_slot::end_sleep() {
  std::uint32_t found = sleeping;
  return shared_word(*word_).compare_exchange_strong(found, empty);
}

std::optional<std::size_t> frame_slot::take(std::span<std::uint8_t> room) {
  const std::uint32_t size = shared_word(*word_).load(std::memory_order_acquire);
  if (size < shortest || size > room_.size() || size > room.size()) return std::nullopt;
  std::memcpy(room.data(), room_.data(), size);
  shared_word(*word_).store(empty, std::memory_order_release);
  return size;
}

}  // namespace hosted_tee
