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

// A newcomer's queue is empty: this does not wait.
void turn_away(int socket) {
  std::array<std::uint8_t, remote::header_size + sizeof(std::uint32_t)> room{};
  remote::frame_builder builder(room, remote::refused_kind, 0);
  remote::write_body(builder.body(), remote::refusal_answer{remote::refusal::crowded});
  (void)send_packet(socket, builder.finish());
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

server::~server() {
  end_all();
}

void server::stop() noexcept {
  core_.stopping = true;
  signal_to(wake_.get());
}

// False: it is time to end.
bool server::wait(int also_stops) {
  std::array<pollfd, 3> watched{{{wake_.get(), POLLIN, 0}, {also_stops, POLLIN, 0}, {listener_.get(), POLLIN, 0}}};
  if (::poll(watched.data(), watched.size(), -1) < 0 && errno != EINTR) fail("poll");
  if ((watched[0].revents & POLLIN) != 0) clear(wake_.get());
  return !core_.stopping && watched[1].revents == 0;
}

void server::run(int also_stops) {
  while (wait(also_stops)) accept_some();
  if (on_stopping_) on_stopping_();
  listener_ = {};  // who still waits there is told at once
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
  return clients_.size() + kept < limits.connections && of_user < limits.connections_per_user &&
         of_process < limits.connections_per_process;
}

// A newcomer costs little before it is known that there is room for it.
void server::take_in(file_descriptor socket) {
  const int raw = socket.get();
  client_list fresh;
  try {
    peer newcomer(raw);
    reap();
    if (has_room_for(newcomer)) {
      fresh.emplace_back(std::move(socket), std::move(newcomer), core_);
      start(fresh);
      return;
    }
    turn_away(raw);
  } catch (const std::exception&) {
    if (!fresh.empty()) turn_away(raw);  // want of threads. Of memory: its socket is closed, and the others go on.
  }
  ++core_.counters.refused;
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
  has_ended_.wait(lock, [this] { return clients_.empty(); });
  lock.unlock();
  for (client& gone : ended_) {
    if (gone.thread.joinable()) gone.thread.join();
  }
}

}  // namespace hosted_tee
