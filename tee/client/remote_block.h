// Shared memory of a context whose TEE is behind a server.
#ifndef TEE_CLIENT_REMOTE_BLOCK_H_
#define TEE_CLIENT_REMOTE_BLOCK_H_

#include "tee/client/remote_link.h"

namespace hosted_tee {

/// Memory that was allocated is the shared file itself. Memory of the client's own has a shared file beside it, through
/// which each operation copies what it refers to.
class remote_block final : public shared_block {
 public:
  remote_block(remote_link& link, known_memory memory)
      : shared_block(link.shared_from_this()), link_(link), memory_(std::move(memory)) {}
  remote_block(remote_link& link, known_memory memory, const TEEC_SharedMemory& own)
      : remote_block(link, std::move(memory)) {
    own_ = static_cast<const std::uint8_t*>(own.buffer);
  }
  ~remote_block() override { link_.forget(memory_.block); }

  [[nodiscard]] void* allocated() const override { return is_copy() ? nullptr : memory_.memory.bytes().data(); }
  [[nodiscard]] bool is_copy() const { return own_ != nullptr; }
  [[nodiscard]] std::uint32_t number() const { return memory_.block; }
  [[nodiscard]] std::span<std::uint8_t> bytes() const { return memory_.memory.bytes(); }

  /// Where the client sees the first of these bytes.
  [[nodiscard]] const std::uint8_t* clients_view() const { return is_copy() ? own_ : bytes().data(); }

 private:
  remote_link& link_;
  known_memory memory_;
  const std::uint8_t* own_ = nullptr;
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_REMOTE_BLOCK_H_
