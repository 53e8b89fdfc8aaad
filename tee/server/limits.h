// How much a server gives to how many. Everything that a client can ask for has a bound.
#ifndef TEE_SERVER_LIMITS_H_
#define TEE_SERVER_LIMITS_H_

#include <algorithm>
#include <chrono>
#include <cstdint>

namespace hosted_tee {

struct server_limits {
  std::uint32_t connections = 512;
  std::uint32_t connections_per_user = 384;     ///< so that one user does not take them all
  std::uint32_t connections_per_process = 128;  ///< nor one process all of its user's
  std::uint32_t connections_kept = 4;           ///< of them all, for those who may manage the server
  std::uint32_t sessions = 64;                  ///< of a connection
  std::uint32_t blocks = 64;                    ///< of shared memory, of a connection

  // Bytes of these blocks.
  std::uint64_t memory = 256ULL << 20;           ///< of a connection
  std::uint64_t memory_of_all = 1ULL << 30;      ///< less than a service may use, see packaging/systemd
  std::uint64_t memory_per_user = 768ULL << 20;  ///< as with the connections
  std::uint64_t memory_per_process = 256ULL << 20;

  std::chrono::seconds first_request{10};  ///< from the connection on
  std::chrono::seconds answer_taken{10};   ///< until an answer that nobody takes ends the connection

  /// allow_connections takes the number of them all (at least 1), and gives a user three quarters of it, a process one
  /// quarter, and at least 1.
  constexpr void allow_connections(std::uint32_t all) {
    connections = all;
    connections_per_user = std::max(all - all / 4, 1U);
    connections_per_process = std::max(all / 4, 1U);
    connections_kept = std::min(all / 8, 4U);
  }

  /// allow_memory takes the bytes of a connection. A process has no more, a user three times as much, all together have
  /// four times as much.
  constexpr void allow_memory(std::uint64_t of_connection) {
    memory = memory_per_process = of_connection;
    memory_per_user = 3 * of_connection;
    memory_of_all = 4 * of_connection;
  }
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_LIMITS_H_
