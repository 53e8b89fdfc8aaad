// A channel with slots whose other side keeps no rule: between two calls it writes into their memory what it likes, and
// sends, or leaves. What a call answers, and what it changes, must be what a model of the channel foretells.
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <deque>
#include <utility>

#include "fuzz/fuzz_device.h"
#include "fuzz/slot_steps.h"
#include "tee/socket/frame_channel.h"

using namespace hosted_tee;

namespace fuzzing {
namespace {

constexpr slot_layout layout{longest_in_slot};

// More than the slots have: what lies behind them is in the same page.
constexpr std::size_t all_memory = 2 * slot_layout::first_room;

constexpr std::uint32_t sleeping = 1, shortest_frame = 2;

// Fewer than the kernel keeps for who does not read.
constexpr std::size_t most_wake_ups = 16, most_packets = 16;

/// with_nobody_watching does `work` while all of the process's places for watching are taken, so that whoever waits
/// sleeps at once.
template <class Work>
void with_nobody_watching(const Work& work) {
  patience place(std::chrono::hours(1));
  const bool is_done = place.watch([&] {
    with_nobody_watching(work);
    return true;
  });
  if (!is_done) work();
}

/// Where one of the slots lies.
struct slot_place {
  std::size_t word, room;
};
constexpr slot_place requests{slot_layout::request_word, slot_layout::first_room};
constexpr slot_place answers{slot_layout::answer_word, slot_layout::first_room + longest_in_slot};

std::pair<file_descriptor, file_descriptor> socket_pair() {
  std::array<int, 2> ends{-1, -1};
  require(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) == 0, "sockets can be had");
  return {file_descriptor(ends[0]), file_descriptor(ends[1])};
}

/// The channel, and what the other side has.
class channel_game {
 public:
  explicit channel_game(bool asks) : channel_game(asks, socket_pair(), make_shared_file(all_memory)) {}

  /// Plays the next step. False: the connection is over.
  bool play(input_reader& input);

  /// What is woken in the end is what was to be.
  void end() { check_wake_ups(); }

 private:
  channel_game(bool asks, std::pair<file_descriptor, file_descriptor> ends, shared_file file)
      : incoming_(asks ? answers : requests),
        outgoing_(asks ? requests : answers),
        channel_(std::move(ends.first)),
        other_(std::move(ends.second)),
        memory_(std::move(file)) {
    channel_.use_slots(*map_file(memory_.file.get(), layout.size()), layout,
                       asks ? frame_channel::side::asks : frame_channel::side::answers);
  }

  [[nodiscard]] std::span<std::uint8_t> memory() const { return memory_.memory.bytes(); }
  [[nodiscard]] bytes snapshot() const { return {memory().begin(), memory().end()}; }
  [[nodiscard]] bool is_memory(const bytes& expected) const {
    return std::memcmp(memory().data(), expected.data(), expected.size()) == 0;
  }

  static std::uint32_t word_in(std::span<const std::uint8_t> memory, const slot_place& slot) {
    std::uint32_t value = 0;
    std::memcpy(&value, &memory[slot.word], sizeof value);
    return value;
  }
  static void set_word_in(std::span<std::uint8_t> memory, const slot_place& slot, std::uint32_t value) {
    std::memcpy(&memory[slot.word], &value, sizeof value);
  }

  void set_word(input_reader& input);
  void set_bytes(input_reader& input);
  void send(input_reader& input);
  void take_wake_ups(input_reader& /*input*/) { check_wake_ups(); }
  void hang_up(input_reader& /*input*/) { other_ = {}; }
  void receive(input_reader& input) { receive_frame(input, false); }
  void receive_asleep(input_reader& input) { receive_frame(input, true); }
  void put(input_reader& input);

  void check_wake_ups();
  void receive_frame(input_reader& input, bool asleep);
  void check_from_slot(const received& taken, std::span<const std::uint8_t> room, bytes before) const;
  void check_from_socket(const received& taken, std::span<const std::uint8_t> room, bytes before, bool asleep);

  struct packet {
    bytes content;
    std::size_t descriptors;
  };

  slot_place incoming_, outgoing_;
  frame_channel channel_;
  file_descriptor other_;
  shared_file memory_;
  std::deque<packet> sent_;   // and not yet received
  std::size_t wake_ups_ = 0;  // that the other side has not taken
  bool is_over_ = false;
};

bool channel_game::play(input_reader& input) {
  // The order is that of slot_step.
  static constexpr std::array<void (channel_game::*)(input_reader&), slot_step_count> steps{
      &channel_game::set_word, &channel_game::set_bytes, &channel_game::send,           &channel_game::take_wake_ups,
      &channel_game::hang_up,  &channel_game::receive,   &channel_game::receive_asleep, &channel_game::put,
  };
  (this->*steps[input.below(steps.size())])(input);
  return !is_over_;
}

void channel_game::set_word(input_reader& input) {
  const slot_place& slot = input.below(2) == 0 ? incoming_ : outgoing_;
  set_word_in(memory(), slot, input.below(2) == 0 ? input.u8() : input.u32());
}

void channel_game::set_bytes(input_reader& input) {
  const std::size_t offset = input.number(2) % all_memory;
  const bytes content = input.take(std::min(input.below(256), all_memory - offset));
  std::ranges::copy(content, memory().begin() + static_cast<std::ptrdiff_t>(offset));
}

void channel_game::send(input_reader& input) {
  const bool with_descriptor = input.below(4) == 1;
  const bytes content = input.take(input.below(longest_in_slot + 4));
  if (!other_.is_open() || sent_.size() == most_packets) return;
  require(send_packet(other_.get(), content, with_descriptor ? memory_.file.get() : -1) == 0,
          "the kernel takes a packet");
  sent_.push_back({content, with_descriptor ? 1U : 0U});
}

void channel_game::check_wake_ups() {
  if (!other_.is_open()) return;
  for (; wake_ups_ != 0; --wake_ups_) {
    std::array<std::uint8_t, 2> room{};
    require(::recv(other_.get(), room.data(), room.size(), MSG_DONTWAIT) == 1 && room[0] == 0,
            "a sleeper is woken by one zero byte");
  }
  std::uint8_t more = 0;
  require(::recv(other_.get(), &more, 1, MSG_DONTWAIT) < 0 && errno == EAGAIN, "nobody else is woken");
}

void channel_game::receive_frame(input_reader& input, bool asleep) {
  bytes room(1 + input.below(longest_in_slot + 2), 0xA5);
  const bytes before = snapshot();
  const bool from_slot = word_in(before, incoming_) != 0;
  // It would wait for ever.
  if (!from_slot && sent_.empty()) hang_up(input);
  received taken;
  const auto receive = [&] { taken = channel_.receive(room); };
  if (asleep) {
    with_nobody_watching(receive);
  } else {
    receive();
  }
  if (from_slot) {
    check_from_slot(taken, room, before);
  } else {
    check_from_socket(taken, room, before, asleep);
  }
  const std::size_t written = taken.how == arrival::packet ? taken.size : 0;
  if (taken.how != arrival::unfit || from_slot) {
    require(std::all_of(room.begin() + static_cast<std::ptrdiff_t>(written), room.end(),
                        [](std::uint8_t byte) { return byte == 0xA5; }),
            "what does not belong to the frame is left alone");
  }
  is_over_ = taken.how != arrival::packet;
}

void channel_game::check_from_slot(const received& taken, std::span<const std::uint8_t> room, bytes before) const {
  const std::uint32_t word = word_in(before, incoming_);
  if (word < shortest_frame || word > longest_in_slot || word > room.size()) {
    require(taken.how == arrival::unfit && taken.size == 0, "a word that is no length is unfit");
  } else {
    require(taken.how == arrival::packet && taken.by == way::slot && taken.size == word && taken.descriptors.empty(),
            "the slot's frame is taken first");
    require(std::ranges::equal(room.first(word), std::span(before).subspan(incoming_.room, word)),
            "a frame is what lies in the slot");
    set_word_in(before, incoming_, 0);
  }
  require(is_memory(before), "taking a frame empties the slot, and does nothing else to the memory");
}

void channel_game::check_from_socket(const received& taken, std::span<const std::uint8_t> room, bytes before,
                                     bool asleep) {
  const packet expected = sent_.empty() ? packet{} : sent_.front();
  if (!sent_.empty()) sent_.pop_front();
  const bytes& content = expected.content;
  // To who is awake it is a packet that is shorter than any frame.
  const bool is_wake_up = content == bytes{0} && expected.descriptors == 0;
  if (content.empty()) {
    require(taken.how == arrival::end, "the end is seen at the socket");
  } else if (content.size() > room.size()) {
    require(taken.how == arrival::unfit, "a packet that is longer than the room is unfit");
  } else if (is_wake_up && (asleep || taken.how == arrival::unfit)) {
    require(taken.how == arrival::unfit, "a wake-up without a frame is unfit");
  } else {
    require(taken.how == arrival::packet && taken.by == way::socket && taken.size == content.size() &&
                taken.descriptors.size() == expected.descriptors && !taken.has_lost,
            "a packet comes whole, with what was sent with it");
    require(std::ranges::equal(room.first(content.size()), content), "a packet is what was sent");
  }
  // Who slept takes that back unless the connection is over.
  if (taken.how != arrival::packet && word_in(memory(), incoming_) == sleeping)
    set_word_in(before, incoming_, sleeping);
  require(is_memory(before), "a packet changes nothing in the memory");
}

void channel_game::put(input_reader& input) {
  const bytes frame(input.below(longest_in_slot + 3), input.u8());
  if (wake_ups_ == most_wake_ups) check_wake_ups();
  bytes expected = snapshot();
  const std::uint32_t word = word_in(expected, outgoing_);
  const int error = channel_.put(frame);
  const bool fits = frame.size() >= shortest_frame && frame.size() <= longest_in_slot;
  if (fits) {
    std::ranges::copy(frame, expected.begin() + static_cast<std::ptrdiff_t>(outgoing_.room));
    set_word_in(expected, outgoing_, static_cast<std::uint32_t>(frame.size()));
  }
  require(is_memory(expected), "putting a frame fills the slot, and does nothing else to the memory");
  if (!fits || word > sleeping) {
    require(error == EPROTO, "a slot that the other side has spoilt takes nothing");
  } else if (word == sleeping && !other_.is_open()) {
    require(error == EPIPE || error == ECONNRESET, "a sleeper that has left is missed");
  } else {
    require(error == 0, "a slot that is empty takes a frame");
    if (word == sleeping) ++wake_ups_;
  }
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  input_reader input({data, size});
  channel_game game(input.below(2) == 0);
  while (!input.empty() && game.play(input)) {
  }
  game.end();
  return 0;
}
