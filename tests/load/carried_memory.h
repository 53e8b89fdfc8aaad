// One memory slot of a command, with what it refers to.
#ifndef TESTS_LOAD_CARRIED_MEMORY_H_
#define TESTS_LOAD_CARRIED_MEMORY_H_

#include "tee_client_api.h"
#include "tests/support/bytes.h"

namespace load {

/// How a slot's bytes travel.
enum class passage { temporary, registered, allocated, allocated_whole };
inline constexpr std::size_t passages = 4;

/// Bytes with others around them that nobody may touch; all of allocated_whole's belong to the slot.
class carried_memory {
 public:
  /// Makes what `way` asks for, of `context`. `type` is one of TEEC_MEMREF_TEMP_*. Throws std::runtime_error when the
  /// server refuses.
  carried_memory(TEEC_Context& context, passage way, const testing_support::bytes& content, std::uint32_t type);
  carried_memory(const carried_memory&) = delete;
  carried_memory& operator=(const carried_memory&) = delete;
  ~carried_memory();

  /// type is what TEEC_PARAM_TYPES gets, and refer fills the slot in.
  [[nodiscard]] std::uint32_t type() const;
  void refer(TEEC_Parameter& slot);

  /// size is what the call left in `slot`; content is what the bytes are now. Throws std::runtime_error when bytes
  /// around them have changed.
  [[nodiscard]] std::size_t size(const TEEC_Parameter& slot) const;
  [[nodiscard]] testing_support::bytes content() const;

 private:
  [[nodiscard]] const std::uint8_t* start() const;

  passage way_;
  std::uint32_t type_;
  std::size_t size_;
  std::size_t margin_ = 24;  // before and behind
  testing_support::bytes own_;
  TEEC_SharedMemory block_ = {};
};

}  // namespace load

#endif  // TESTS_LOAD_CARRIED_MEMORY_H_
