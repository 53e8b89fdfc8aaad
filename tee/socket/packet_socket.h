// Packets with descriptors over a Unix socket of type SOCK_SEQPACKET. The kernel keeps the packets apart: one arrives
// whole or not at all, and the descriptors that were sent with it come with it and with no other.
#ifndef TEE_SOCKET_PACKET_SOCKET_H_
#define TEE_SOCKET_PACKET_SOCKET_H_

#include <sys/un.h>

#include <chrono>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {

/// socket_address is the address of a socket file. Throws std::system_error (ENAMETOOLONG, EINVAL for an empty path).
[[nodiscard]] sockaddr_un socket_address(const std::string& path);

/// connect_to connects to the server at `path`. Throws std::system_error.
[[nodiscard]] file_descriptor connect_to(const std::string& path);

/// limit_receiving and limit_sending bound how long either waits; 0 is without bound. Throw std::system_error.
void limit_receiving(int socket, std::chrono::seconds seconds);
void limit_sending(int socket, std::chrono::seconds seconds);

/// send_packet sends one packet, with a descriptor unless `passed` is -1. Answers 0 or the error's number: EPIPE when
/// nobody is there any more, EAGAIN when nobody takes it within the limit. Raises no SIGPIPE.
[[nodiscard]] int send_packet(int socket, std::span<const std::uint8_t> packet, int passed = -1);

enum class arrival {
  packet,
  end,      ///< the other side has closed, or has died
  overdue,  ///< nothing came within the limit
  unfit,    ///< a packet that is longer than the room, or that brings more descriptors than anything needs; it is gone
};

/// How it came.
enum class way { socket, slot };

/// What has come. Every descriptor that came is here or closed.
struct received {
  arrival how = arrival::end;
  std::size_t size = 0;
  std::vector<file_descriptor> descriptors;
  way by = way::socket;
  bool has_lost = false;  ///< what was sent with it, a descriptor at least: this process had no room for another
};

/// receive_packet sleeps until the next packet comes.
[[nodiscard]] received receive_packet(int socket, std::span<std::uint8_t> room);

/// look_for_packet takes the packet, or the end, that is already there. Nothing when there is none.
[[nodiscard]] std::optional<received> look_for_packet(int socket, std::span<std::uint8_t> room);

}  // namespace hosted_tee

#endif  // TEE_SOCKET_PACKET_SOCKET_H_
