// How a connection takes requests in and lets answers out.
#include "tee/server/connection.h"

#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>

namespace hosted_tee {

using remote::frame_kind;

namespace {

/// While one is there, the flag is set.
class mark {
 public:
  explicit mark(std::atomic<bool>& flag) : flag_(flag) { flag_ = true; }
  mark(const mark&) = delete;
  mark& operator=(const mark&) = delete;
  ~mark() { flag_ = false; }

 private:
  std::atomic<bool>& flag_;
};

std::vector<std::uint32_t> with_room(std::size_t count) {
  std::vector<std::uint32_t> made;
  made.reserve(count);
  return made;
}

}  // namespace

/// A kind of request: who carries it out, and with how many descriptors it comes.
struct connection::request_row {
  frame_kind kind;
  std::size_t descriptors;
  bool (connection::*work)(const remote::frame& request, int file);
};

const connection::request_row* connection::find_row(std::uint16_t kind) {
  static constexpr std::array<request_row, 10> rows{{
      {frame_kind::hello, 0, &connection::hello},
      {frame_kind::open_session, 0, &connection::open_session},
      {frame_kind::invoke, 0, &connection::invoke},
      {frame_kind::close_session, 0, &connection::close_session},
      {frame_kind::share_memory, 1, &connection::share_memory},
      {frame_kind::release_memory, 0, &connection::release_memory},
      {frame_kind::use_slots, 1, &connection::use_slots},
      {frame_kind::status, 0, &connection::status},
      {frame_kind::log, 0, &connection::log},
      {frame_kind::stop, 0, &connection::stop},
  }};
  const auto* const row =
      std::find_if(rows.begin(), rows.end(), [&](const auto& r) { return static_cast<std::uint16_t>(r.kind) == kind; });
  return row == rows.end() ? nullptr : row;
}

// What may fail comes before the socket is taken.
connection::connection(file_descriptor&& socket, peer client, server_core& core)
    : core_(core),
      client_(std::move(client)),
      blocks_(core.limits, core.memory, {client_.user(), client_.process()}),
      sessions_(with_room(core.limits.sessions)),
      request_room_(remote::frame_limit),
      answer_room_(remote::frame_limit),
      scratch_(remote::frame_limit),
      channel_(std::move(socket)) {}

void connection::serve() noexcept {
  next step = next::drop;
  try {
    limit_receiving(channel_.socket(), core_.limits.first_request);
    limit_sending(channel_.socket(), core_.limits.answer_taken);
    do {
      step = serve_one();
    } while (step == next::go_on && !core_.stopping);
  } catch (const std::exception&) {
    step = next::drop;  // want of memory: this connection ends, and the others go on
  }
  if (step == next::drop) ++core_.counters.dropped;
  clean_up();
}

// Who asked the server to stop sees the connection end when the server has.
void connection::clean_up() noexcept {
  const mark working(works_);
  for (const std::uint32_t session : sessions_) {
    try {
      core_.world->close_session(session);
    } catch (const std::exception&) {
      // The session is gone for the client either way; its TA's instance goes with the others.
    }
  }
  sessions_.clear();
  // At the server's own end a client may still have an answer to take, and goes on without the server.
  if (core_.stopping) {
    blocks_.clear();
  } else {
    blocks_.remove_all();
    channel_.empty_slots();
  }
  ::shutdown(channel_.socket(), asked_to_stop_ ? SHUT_RD : SHUT_RDWR);
}

void connection::end_soon() {
  ::shutdown(channel_.socket(), SHUT_RD);
}

connection::next connection::refuse(remote::refusal why) {
  remote::frame_builder builder(answer_room_, remote::refused_kind, 0);
  remote::write_body(builder.body(), remote::refusal_answer{why});
  (void)channel_.send(builder.finish());
  return next::drop;
}

// What came with the request is closed behind the answer.
connection::next connection::serve_one() {
  const received packet = channel_.receive(request_room_);
  return serve_packet(packet);
}

connection::next connection::serve_packet(const received& packet) {
  const mark working(works_);
  if (packet.how == arrival::end) return next::ended;
  if (packet.how == arrival::overdue) return next::drop;
  remote::frame request;
  if (packet.how == arrival::unfit || !remote::read_frame({request_room_.data(), packet.size}, request)) {
    return refuse(remote::refusal::malformed);
  }
  if (request.header.version != remote::wire_version) return refuse(remote::refusal::version);
  const request_row* const row = find_row(request.header.kind);
  const std::size_t sent = packet.has_lost ? 1 : packet.descriptors.size();
  if (row == nullptr || sent != row->descriptors || (row->kind == frame_kind::hello) == has_greeted_) {
    return refuse(remote::refusal::malformed);
  }
  const int file = packet.descriptors.empty() ? -1 : packet.descriptors.front().get();
  if (!(this->*row->work)(request, file)) return refuse(remote::refusal::malformed);
  const int error = packet.by == way::slot ? channel_.put(answer_) : channel_.send(answer_);
  if (error == EPROTO) return refuse(remote::refusal::malformed);
  return error == 0 ? next::go_on : next::ended;
}

}  // namespace hosted_tee
