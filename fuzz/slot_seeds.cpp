#include "fuzz/slot_seeds.h"

#include "fuzz/slot_steps.h"

namespace fuzzing {
namespace {

constexpr int incoming = 0, outgoing = 1;
constexpr int longest = longest_in_slot;

/// The bytes behind a step are its choices, in the order in which slot_fuzzer.cpp asks for them.
class life {
 public:
  life(int side, slot_step receive) : all_{static_cast<std::uint8_t>(side)}, receive_(receive) {}

  life& add(slot_step step, std::initializer_list<int> choices = {}) {
    all_.push_back(static_cast<std::uint8_t>(step));
    for (const int choice : choices) all_.push_back(static_cast<std::uint8_t>(choice));
    return *this;
  }
  life& set_word(int slot, int value) { return add(slot_step::set_word, {slot, 0, value}); }
  life& receive() { return add(receive_, {longest}); }

  [[nodiscard]] const bytes& all() const { return all_; }

 private:
  bytes all_;
  slot_step receive_;
};

life first_part(int side, slot_step receive) {
  life begun(side, receive);
  for (const int size : {16, 2, longest}) {
    begun.add(slot_step::set_bytes, {0, 16, 3, 1, 2, 3}).set_word(incoming, size).receive();
    begun.add(slot_step::put, {size, 7}).set_word(outgoing, 1);
    begun.add(slot_step::put, {size, 8}).add(slot_step::take_wake_ups).set_word(outgoing, 0);
    begun.add(slot_step::send, {0, 3, 1, 2, 3}).receive();
    begun.add(slot_step::send, {1, 2, 1, 2}).receive();  // with a descriptor
  }
  return begun;
}

}  // namespace

std::vector<std::pair<std::string, bytes>> slot_seeds() {
  std::vector<std::pair<std::string, bytes>> all;
  for (const int side : {0, 1}) {
    for (const slot_step receive : {slot_step::receive, slot_step::receive_asleep}) {
      const std::string name = std::to_string(side) + (receive == slot_step::receive ? "_watches_" : "_sleeps_");
      const life begun = first_part(side, receive);
      all.emplace_back(name + "until_the_end", life(begun).add(slot_step::hang_up).receive().all());
      all.emplace_back(name + "for_nothing", life(begun).add(slot_step::send, {0, 1, 0}).receive().all());
      for (const int word : {1, longest + 1, 255}) {
        all.emplace_back(name + "word_" + std::to_string(word), life(begun).set_word(incoming, word).receive().all());
      }
    }
  }
  return all;
}

}  // namespace fuzzing
