#include "tee/socket/frame_channel.h"

#include <array>
#include <cerrno>

#if defined(__SANITIZE_THREAD__)
#include <sanitizer/tsan_interface.h>

#include <cstdio>
#endif

namespace hosted_tee {
namespace {

// Shorter than any frame.
constexpr std::array<std::uint8_t, 1> wake_up = {0};

#if defined(__SANITIZE_THREAD__)
// The thread sanitizer knows memory by its address, and each side has the slots at another. So it is told what orders
// them when both are in one process; between sockets it sees it by itself, and no more finely.
// The place stands for all slots, and is one for all libraries of the process that have a copy of this code. What it
// orders too much between connections, teed with clients in other processes does not have.
void tell_put() {
  __tsan_release(stderr);
}
void tell_taken() {
  __tsan_acquire(stderr);
}
#else
void tell_put() {}
void tell_taken() {}
#endif

// The longest of the usual commands is a signature with an RSA key, of a good half of a millisecond. To be woken after
// it would cost the client a tenth of that again.
constexpr auto until_answered = std::chrono::milliseconds(1);

// A look at the socket is a system call, and costs as much as many at a slot.
constexpr unsigned looks_at_the_slot = 32;

bool is_wake_up(const received& packet, std::span<const std::uint8_t> bytes) {
  return packet.how == arrival::packet && packet.size == wake_up.size() && bytes[0] == wake_up[0] &&
         packet.descriptors.empty();
}

}  // namespace

void frame_channel::use_slots(mapped_memory memory, slot_layout layout, side mine) {
  const std::span<std::uint8_t> all = memory.bytes();
  const frame_slot requests(&all[slot_layout::request_word], all.subspan(slot_layout::first_room, layout.longest));
  const frame_slot answers(&all[slot_layout::answer_word],
                           all.subspan(slot_layout::first_room + layout.longest, layout.longest));
  const bool asks = mine == side::asks;
  if (asks) waiting_ = patience(until_answered);
  memory_.emplace(slots{std::move(memory), asks ? answers : requests, asks ? requests : answers});
}

void frame_channel::empty_slots() {
  if (memory_) memory_->memory.empty_file();
}

received frame_channel::take(std::span<std::uint8_t> room) {
  const std::optional<std::size_t> size = memory_->incoming.take(room);
  if (!size) return {arrival::unfit, 0, {}};
  tell_taken();
  return {arrival::packet, *size, {}, way::slot};
}

received frame_channel::receive(std::span<std::uint8_t> room) {
  std::optional<received> found;
  unsigned looks = 0;
  const bool has_come = waiting_.watch([&] {
    if (memory_ && memory_->incoming.watch()) {
      found = take(room);
    } else if (!memory_ || ++looks % looks_at_the_slot == 0) {
      found = look_for_packet(socket_.get(), room);
      // What was put into the slot before the end is still to be taken.
      if (found && found->how == arrival::end && memory_ && memory_->incoming.watch()) found = take(room);
    }
    return found.has_value();
  });
  return has_come ? std::move(*found) : receive_sleeping(room);
}

// Whoever puts a frame there after begin_sleep sends a wake-up, so that none is missed and none comes twice.
received frame_channel::receive_sleeping(std::span<std::uint8_t> room) {
  if (memory_ && !memory_->incoming.begin_sleep()) return take(room);
  received packet = receive_packet(socket_.get(), room);
  if (!memory_) return packet;
  if (is_wake_up(packet, room)) return take(room);
  if (packet.how == arrival::packet && !memory_->incoming.end_sleep()) packet.how = arrival::unfit;
  return packet;
}

int frame_channel::put(std::span<const std::uint8_t> frame) {
  tell_put();
  switch (memory_->outgoing.put(frame)) {
    case frame_slot::handed::over:
      return 0;
    case frame_slot::handed::to_sleeper:
      return send(wake_up);
    default:
      return EPROTO;
  }
}

}  // namespace hosted_tee
