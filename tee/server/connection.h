// One client's connection, from its hello to its end.
#ifndef TEE_SERVER_CONNECTION_H_
#define TEE_SERVER_CONNECTION_H_

#include <atomic>
#include <cstdint>
#include <vector>

#include "tee/remote/frame.h"
#include "tee/remote/messages.h"
#include "tee/runtime/file_descriptor.h"
#include "tee/server/call_memory.h"
#include "tee/server/core.h"
#include "tee/server/peer.h"
#include "tee/server/shared_memory.h"
#include "tee/socket/frame_channel.h"

namespace hosted_tee {

/// Everything that the client opened or shared is closed and unmapped when serve returns, however the client went.
class connection {
 public:
  /// `client` is who is at the other end of `socket`. `core` outlives the connection.
  connection(file_descriptor&& socket, peer client, server_core& core);
  connection(const connection&) = delete;
  connection& operator=(const connection&) = delete;
  ~connection() = default;

  [[nodiscard]] const peer& client() const { return client_; }

  /// serve answers requests until the client closes, dies or breaks the rules, or the server stops. A thread of its own
  /// runs it.
  void serve() noexcept;

  /// end_soon, from any thread, has serve return after the request that it is working on.
  void end_soon();

  /// Whether its thread carries out or answers a request, or gives up what the client had. Else it waits for the
  /// client, or closes what it passed, which may take any time: then the thread may be nudged.
  [[nodiscard]] bool works() const { return works_; }

  /// take_socket gives the socket away, before or after serve.
  [[nodiscard]] file_descriptor take_socket() { return channel_.take_socket(); }

 private:
  struct request_row;
  static const request_row* find_row(std::uint16_t kind);

  enum class next { go_on, ended, drop };

  [[nodiscard]] next serve_one();
  [[nodiscard]] next serve_packet(const received& packet);
  [[nodiscard]] next refuse(remote::refusal why);
  [[nodiscard]] bool may_manage() const;
  [[nodiscard]] TEE_Identity identity_for(const remote::open_request& request, remote::outcome& found) const;
  [[nodiscard]] bool owns(std::uint32_t session) const;
  void clean_up() noexcept;

  template <class Command>
  void take_turn(remote::outcome& told, const Command& carry_out);

  // A request's work: its answer goes into answer_. False when the body is not one of its kind.
  [[nodiscard]] bool hello(const remote::frame& request, int file);
  [[nodiscard]] bool open_session(const remote::frame& request, int file);
  [[nodiscard]] bool invoke(const remote::frame& request, int file);
  [[nodiscard]] bool close_session(const remote::frame& request, int file);
  [[nodiscard]] bool share_memory(const remote::frame& request, int file);
  [[nodiscard]] bool release_memory(const remote::frame& request, int file);
  [[nodiscard]] bool use_slots(const remote::frame& request, int file);
  [[nodiscard]] bool status(const remote::frame& request, int file);
  [[nodiscard]] bool log(const remote::frame& request, int file);
  [[nodiscard]] bool stop(const remote::frame& request, int file);

  template <class Answer>
  void answer(const remote::frame& request, const Answer& body) {
    const auto kind = static_cast<std::uint16_t>(request.header.kind | remote::answer_bit);
    remote::frame_builder builder(answer_room_, kind, request.header.sequence);
    remote::write_body(builder.body(), body);
    answer_ = builder.finish();
  }

  server_core& core_;
  peer client_;
  block_collection blocks_;
  std::vector<std::uint32_t> sessions_;  // has room for all that there may be
  std::vector<std::uint8_t> request_room_, answer_room_, scratch_;
  std::span<const std::uint8_t> answer_;
  bool has_greeted_ = false;
  bool asked_to_stop_ = false;
  std::atomic<bool> works_{false};
  frame_channel channel_;
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_CONNECTION_H_
