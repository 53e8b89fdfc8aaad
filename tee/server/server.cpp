#include "tee/server/server.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <system_error>

#include "tee/socket/packet_socket.h"

namespace hosted_tee {
namespace {

// How long to leave newcomers waiting when the system has no descriptor or no memory for them.
constexpr int breather_ms = 50;

constexpr int most_a_round = 64;

// How often what takes its time to close is cut short, when somebody waits behind it.
constexpr int hurry_ms = 5;

// How long a client's thread may take for what can take any time, when the server ends.
constexpr auto between_nudges = std::chrono::milliseconds(20);

[[noreturn]] void fail(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

file_descriptor make_wake() {
  file_descriptor wake(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  if (!wake.is_open()) fail("eventfd");
  return wake;
}

void signal_to(int wake) noexcept {
  const std::uint64_t one = 1;
  (void)!::write(wake, &one, sizeof one);
}

void clear(int wake) noexcept {
  std::uint64_t count = 0;
  (void)!::read(wake, &count, sizeof count);
}

}  // namespace

server::server(server_options options)
    : listener_(std::move(options.listener)), wake_(make_wake()), on_stopping_(std::move(options.on_stopping)) {
  core_.world = std::move(options.world);
  core_.state = std::move(options.state);
  core_.limits = options.limits;
  core_.stop = [this] { stop(); };
  // A client that leaves between poll and accept must not leave the server waiting for another.
  if (::fcntl(listener_.get(), F_SETFL, O_NONBLOCK) != 0) fail("the listening socket");
}

// What clients have left unread at the end is closed as at any other time.
server::~server() {
  closer_.take_over(std::move(listener_));
  end_all();
  for (client& gone : ended_) closer_.take_over(gone.link.take_socket());
}

void server::stop() noexcept {
  core_.stopping = true;
  signal_to(wake_.get());
}

// False: it is time to end.
bool server::wait(int also_stops) {
  std::array<pollfd, 3> watched{{{wake_.get(), POLLIN, 0}, {also_stops, POLLIN, 0}, {listener_.get(), POLLIN, 0}}};
  const int limit = closer_.hurry() ? hurry_ms : -1;
  if (::poll(watched.data(), watched.size(), limit) < 0 && errno != EINTR) fail("poll");
  if ((watched[0].revents & POLLIN) != 0) clear(wake_.get());
  return !core_.stopping && watched[1].revents == 0;
}

void server::run(int also_stops) {
  while (wait(also_stops)) accept_some();
  if (on_stopping_) on_stopping_();
  closer_.take_over(std::move(listener_));  // who still waits there is told at once
  end_all();
  core_.world.reset();
}

// Not all of them: while newcomers keep coming there would be no end, and nothing else would be seen.
void server::accept_some() {
  reap();
  for (int i = 0; i < most_a_round; ++i) {
    file_descriptor socket(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
    const int error = socket.is_open() ? 0 : errno;
    if (error == EMFILE || error == ENFILE || error == ENOMEM || error == ENOBUFS) {
      {
        const std::scoped_lock lock(mutex_);
        hurry_closings();
      }
      pollfd wake{wake_.get(), POLLIN, 0};
      (void)::poll(&wake, 1, breather_ms);
    }
    if (error == 0) {
      take_in(std::move(socket));
    } else if (error != EINTR && error != ECONNABORTED) {
      return;
    }
  }
}

bool server::has_room_for(const peer& newcomer) {
  const std::scoped_lock lock(mutex_);
  std::uint32_t of_user = 0, of_process = 0;
  for (const client& known : clients_) {
    const peer& other = known.link.client();
    if (other.user() != newcomer.user()) continue;
    ++of_user;
    if (other.process() == newcomer.process()) ++of_process;
  }
  const server_limits& limits = core_.limits;
  const std::uint32_t kept = newcomer.may_manage() ? 0 : limits.connections_kept;
  const bool has_room = clients_.size() + kept < limits.connections && of_user < limits.connections_per_user &&
                        of_process < limits.connections_per_process;
  if (!has_room) hurry_closings();
  return has_room;
}

// With mutex_. Places and descriptors are not kept by closings that take their time. Whoever only waits for its client
// goes on with that; so newcomers who are refused one after the other do not have all of them woken each time.
void server::hurry_closings() {
  const auto now = std::chrono::steady_clock::now();
  if (now < next_hurry_) return;
  next_hurry_ = now + std::chrono::milliseconds(hurry_ms);
  for (client& known : clients_) {
    if (!known.link.works()) nudge(known.thread);
  }
}

// A newcomer has been sent nothing yet: this does not wait.
void server::turn_away(file_descriptor socket) {
  std::array<std::uint8_t, remote::header_size + sizeof(std::uint32_t)> room{};
  remote::frame_builder builder(room, remote::refused_kind, 0);
  remote::write_body(builder.body(), remote::refusal_answer{remote::refusal::crowded});
  (void)send_packet(socket.get(), builder.finish());
  closer_.take_over(std::move(socket));
  ++core_.counters.refused;
}

// A newcomer costs little before it is known that there is room for it.
void server::take_in(file_descriptor socket) {
  client_list fresh;
  try {
    peer newcomer(socket.get());
    reap();
    if (has_room_for(newcomer)) {
      fresh.emplace_back(std::move(socket), std::move(newcomer), core_);
      start(fresh);
      return;
    }
  } catch (const std::exception&) {
    // Want of memory or of threads: the others go on.
    if (!fresh.empty()) socket = fresh.front().link.take_socket();
  }
  turn_away(std::move(socket));
}

// Throws when there can be no more threads; `fresh` has its client still.
void server::start(client_list& fresh) {
  const std::scoped_lock lock(mutex_);  // which the thread wants before it ends
  const auto place = fresh.begin();
  place->thread = std::thread([this, place] { serve(place); });
  clients_.splice(clients_.end(), fresh);
}

void server::serve(client_list::iterator place) {
  ++core_.counters.accepted;
  ++core_.counters.connections;
  place->link.serve();
  --core_.counters.connections;
  file_descriptor socket;
  {
    const std::scoped_lock lock(mutex_);
    if (!core_.stopping) socket = place->link.take_socket();
  }
  socket = {};  // in this thread and at the expense of this client's share of connections: it may take any time
  {
    const std::scoped_lock lock(mutex_);
    ended_.splice(ended_.end(), clients_, place);
    has_ended_.notify_all();
  }
  signal_to(wake_.get());
}

// From the server's end on connections stay until the server goes: who asked for it sees it when everything has ended.
void server::reap() {
  client_list ended;
  {
    const std::scoped_lock lock(mutex_);
    if (core_.stopping) return;
    ended.swap(ended_);
  }
  for (client& gone : ended) gone.thread.join();
}

void server::end_all() {
  core_.stopping = true;
  std::unique_lock lock(mutex_);
  for (client& known : clients_) known.link.end_soon();
  while (!has_ended_.wait_for(lock, between_nudges, [this] { return clients_.empty(); })) {
    (void)closer_.hurry();
    hurry_closings();
  }
  lock.unlock();
  for (client& gone : ended_) {
    if (gone.thread.joinable()) gone.thread.join();
  }
}

}  // namespace hosted_tee
