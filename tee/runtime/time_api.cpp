// Time of the Internal Core API 1.1.2 (7).
#include <array>
#include <chrono>
#include <thread>

#include "tee/runtime/device.h"
#include "tee/runtime/platform_call.h"
#include "tee/storage/object_store.h"

namespace hosted_tee {
namespace {

// A TA's persistent time is kept as its distance from the REE's: eight bytes, least significant first.
using time_record = std::array<std::uint8_t, 8>;

std::int64_t to_ms(const TEE_Time& time) {
  return std::int64_t{time.seconds} * 1000 + time.millis;
}

object_key time_key(const instance& self) {
  const uuid_bytes ta = to_bytes(self.uuid);
  return {platform_name_space, "time" + std::string(ta.begin(), ta.end())};
}

object_store& private_store(const instance& self) {
  object_store* store = self.device.store(TEE_STORAGE_PRIVATE);
  if (store == nullptr) throw call_failure(TEE_ERROR_STORAGE_NOT_AVAILABLE);
  return *store;
}

TEE_Result persistent_time(const instance& self, TEE_Time& time) {
  const auto stored = private_store(self).read(time_key(self));
  if (!stored) return TEE_ERROR_TIME_NOT_SET;
  if (stored->size() != time_record{}.size()) return TEE_ERROR_TIME_NEEDS_RESET;
  std::uint64_t distance = 0;
  for (unsigned i = 0; i < 8; ++i) distance |= std::uint64_t{(*stored)[i]} << (8 * i);
  const std::int64_t now = to_ms(self.device.clock.ree()) + static_cast<std::int64_t>(distance);
  if (now < 0) return TEE_ERROR_TIME_NEEDS_RESET;
  time = {static_cast<std::uint32_t>(now / 1000), static_cast<std::uint32_t>(now % 1000)};
  // The seconds are what fits; the standard wants the overflow told.
  return now / 1000 > std::int64_t{0xFFFFFFFF} ? TEE_ERROR_OVERFLOW : TEE_SUCCESS;
}

void set_persistent_time(const instance& self, const TEE_Time& time) {
  const auto distance = static_cast<std::uint64_t>(to_ms(time) - to_ms(self.device.clock.ree()));
  time_record record{};
  for (unsigned i = 0; i < 8; ++i) record[i] = static_cast<std::uint8_t>(distance >> (8 * i));
  private_store(self).write(time_key(self), record);
}

}  // namespace

extern "C" {

void TEE_GetSystemTime(TEE_Time* time) {
  platform_call_void("TEE_GetSystemTime", [&](const instance& self) {
    if (time == nullptr) panic("time is null");
    *time = self.device.clock.system();
  });
}

void TEE_GetREETime(TEE_Time* time) {
  platform_call_void("TEE_GetREETime", [&](const instance& self) {
    if (time == nullptr) panic("time is null");
    *time = self.device.clock.ree();
  });
}

// Nothing can cancel a wait here, so one without an end is answered as cancelled rather than hanging the device.
TEE_Result TEE_Wait(uint32_t timeout) {
  return platform_call("TEE_Wait", nullptr, [&](const instance& self) -> TEE_Result {
    if (timeout == TEE_TIMEOUT_INFINITE) return TEE_ERROR_CANCEL;
    clocks& clock = self.device.clock;
    if (clock.system_is_frozen()) {
      clock.advance(timeout);
    } else {
      std::this_thread::sleep_for(std::chrono::milliseconds(timeout));
    }
    return TEE_SUCCESS;
  });
}

TEE_Result TEE_GetTAPersistentTime(TEE_Time* time) {
  return platform_call("TEE_GetTAPersistentTime", nullptr, [&](const instance& self) {
    if (time == nullptr) panic("time is null");
    *time = {};
    return persistent_time(self, *time);
  });
}

TEE_Result TEE_SetTAPersistentTime(const TEE_Time* time) {
  return platform_call("TEE_SetTAPersistentTime", nullptr, [&](const instance& self) {
    if (time == nullptr || time->millis > 999) panic("not a time");
    set_persistent_time(self, *time);
    return TEE_SUCCESS;
  });
}

}  // extern "C"
}  // namespace hosted_tee
