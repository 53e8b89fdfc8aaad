// A client that keeps no rule, with slots: their words and bytes as a test puts them.
#ifndef TESTS_REMOTE_SLOT_CLIENT_H_
#define TESTS_REMOTE_SLOT_CLIENT_H_

#include <atomic>

#include "tee/socket/frame_channel.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {

constexpr slot_layout wire_slots{remote::frame_limit};

/// The memory of a pair of slots.
class slot_memory {
 public:
  explicit slot_memory(mapped_memory memory) : memory_(std::move(memory)) {}

  using word = std::atomic_ref<std::uint32_t>;
  [[nodiscard]] word request() const { return word_at(0); }
  [[nodiscard]] word answer() const { return word_at(128); }
  [[nodiscard]] std::uint8_t* request_bytes() const { return memory_.bytes().data() + 4096; }
  [[nodiscard]] std::uint8_t* answer_bytes() const { return request_bytes() + 65536; }

 private:
  [[nodiscard]] word word_at(std::size_t offset) const {
    return word(*reinterpret_cast<std::uint32_t*>(memory_.bytes().data() + offset));
  }
  mapped_memory memory_;
};

class slot_client : public raw_client {
 public:
  /// Says hello and shares its slots. Throws unless the server takes them.
  explicit slot_client(const std::string& path);

  [[nodiscard]] const slot_memory& slots() const { return memory_; }

  /// mark writes a frame's bytes and any word, and wakes the server if it sleeps or if `always`.
  void mark(const bytes& frame, std::uint32_t word, bool always = false);
  void put(const bytes& frame) { mark(frame, static_cast<std::uint32_t>(frame.size())); }

  /// take waits for the answer in the slot. No kind: none came within ten seconds.
  raw_answer take();

  /// waits_for_sleep waits until the server has said that it sleeps.
  [[nodiscard]] bool waits_for_sleep() const;

  /// is_refused waits for the end, and tells whether it came with the word that this was no request.
  [[nodiscard]] bool is_refused();

 private:
  slot_client(const std::string& path, shared_file file);

  slot_memory memory_;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_REMOTE_SLOT_CLIENT_H_
