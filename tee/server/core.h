// What the connections of a server share.
#ifndef TEE_SERVER_CORE_H_
#define TEE_SERVER_CORE_H_

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "tee/runtime/secure_world.h"
#include "tee/server/limits.h"
#include "tee/server/shared_memory.h"

namespace hosted_tee {

/// Numbers since the start, except for `connections`.
struct server_counters {
  std::atomic<std::uint32_t> connections{0};
  std::atomic<std::uint64_t> accepted{0};
  std::atomic<std::uint64_t> refused{0};
  std::atomic<std::uint64_t> dropped{0};
};

/// `world` stays until all connections have ended. What is neither constant nor atomic, and `turn`, are for any thread.
struct server_core {
  std::shared_ptr<secure_world> world;
  std::string state;  ///< the state folder, as it is told to those who ask
  server_limits limits;
  std::function<void()> stop;
  std::chrono::steady_clock::time_point started = std::chrono::steady_clock::now();
  std::atomic<bool> stopping{false};
  server_counters counters;
  memory_account memory;
  std::mutex turn;  ///< whose command it is. The world has a lock too, but those who wait there can't turn back.
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_CORE_H_
