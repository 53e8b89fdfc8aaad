// The server: takes connections in, gives each a thread, and ends them all when it is told to.
#ifndef TEE_SERVER_SERVER_H_
#define TEE_SERVER_SERVER_H_

#include <condition_variable>
#include <list>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "tee/runtime/file_descriptor.h"
#include "tee/server/closing.h"
#include "tee/server/connection.h"
#include "tee/server/core.h"

namespace hosted_tee {

struct server_options {
  std::shared_ptr<secure_world> world;
  std::string state;         ///< the state folder, for those who ask
  file_descriptor listener;  ///< a listening SOCK_SEQPACKET socket
  server_limits limits;
  std::function<void()> on_stopping;  ///< called once, when the server begins to end; may be empty
};

/// One thread accepts, one closes, and each connection has one of its own; commands take turns.
class server {
 public:
  /// Throws std::system_error.
  explicit server(server_options options);
  server(const server&) = delete;
  server& operator=(const server&) = delete;
  ~server();

  /// run serves until stop is called or `also_stops` (a descriptor, or -1) becomes readable. Then it takes no more
  /// connections in, lets commands that run finish, closes all sessions, and lets go of the world. Throws
  /// std::system_error when the system does not let it wait any more.
  void run(int also_stops = -1);

  /// stop, from any thread, also before run.
  void stop() noexcept;

 private:
  struct client {
    client(file_descriptor&& socket, peer who, server_core& core) : link(std::move(socket), std::move(who), core) {}
    connection link;
    std::thread thread;
  };
  using client_list = std::list<client>;

  [[nodiscard]] bool wait(int also_stops);
  void accept_some();
  void take_in(file_descriptor socket);
  [[nodiscard]] bool has_room_for(const peer& newcomer);
  void hurry_closings();
  void start(client_list& fresh);
  void serve(client_list::iterator place);
  void reap();
  void turn_away(file_descriptor socket);
  void end_all();

  server_core core_;
  closer closer_;  // of what this thread must not wait for
  file_descriptor listener_;
  file_descriptor wake_;  // an eventfd: something to stop for, or a connection that has ended
  std::function<void()> on_stopping_;
  std::mutex mutex_;  // guards what follows
  client_list clients_;
  client_list ended_;  // their threads are about to return
  std::condition_variable has_ended_;
  std::chrono::steady_clock::time_point next_hurry_;
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_SERVER_H_
