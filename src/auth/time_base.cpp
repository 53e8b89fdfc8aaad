#include "auth/time_base.h"

namespace keymaster {
namespace {
constinit TEE_Time system_at_start = {0, 0};
constinit TEE_Time ree_at_start = {0, 0};
}  // namespace

void time_base_init() {
  TEE_GetSystemTime(&system_at_start);
  TEE_GetREETime(&ree_at_start);
}

TEE_Time time_base_now() {
  TEE_Time system;
  TEE_GetSystemTime(&system);
  // One second is lent to the milliseconds, so that their unsigned difference does not go below zero.
  const uint32_t seconds = ree_at_start.seconds + (system.seconds - system_at_start.seconds) - 1;
  const uint32_t millis = ree_at_start.millis + (system.millis - system_at_start.millis) + 1000;
  return {seconds + millis / 1000, millis % 1000};
}

uint64_t time_base_now_ms() {
  const TEE_Time now = time_base_now();
  return uint64_t{now.seconds} * 1000 + now.millis;
}

}  // namespace keymaster
