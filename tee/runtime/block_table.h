// The blocks of one heap, by their addresses.
#ifndef TEE_RUNTIME_BLOCK_TABLE_H_
#define TEE_RUNTIME_BLOCK_TABLE_H_

#include <cstddef>
#include <cstdint>
#include <vector>

namespace hosted_tee {

struct heap_block {
  void* memory = nullptr;
  std::uint32_t size = 0;  ///< as requested
  bool zero = true;        ///< new bytes are zero
};

/// A hash table in one array (linear probing): a TA allocates for every command, and a node for each block would cost
/// as much as the block.
class block_table {
 public:
  block_table() : slots_(256) {}

  [[nodiscard]] std::size_t size() const { return used_; }
  [[nodiscard]] const std::vector<heap_block>& slots() const { return slots_; }  ///< unused ones have no memory

  /// find answers the block that begins at `memory`, or null. Inserting and erasing move blocks.
  [[nodiscard]] const heap_block* find(const void* memory) const {
    const heap_block& found = slots_[slot_of(memory)];
    return found.memory == nullptr ? nullptr : &found;
  }

  void insert(const heap_block& block) {
    if ((used_ + 1) * 2 > slots_.size()) grow();
    slots_[slot_of(block.memory)] = block;
    ++used_;
  }

  /// erase forgets a block that the table holds, and closes the gap for those that gave way to it.
  void erase(const void* memory) {
    std::size_t gap = slot_of(memory);
    for (std::size_t at = next(gap); slots_[at].memory != nullptr; at = next(at)) {
      const std::size_t distance_from_home = (at - home(slots_[at].memory)) & mask();
      const std::size_t distance_from_gap = (at - gap) & mask();
      if (distance_from_home < distance_from_gap) continue;
      slots_[gap] = slots_[at];
      gap = at;
    }
    slots_[gap] = {};
    --used_;
  }

 private:
  [[nodiscard]] std::size_t mask() const { return slots_.size() - 1; }
  [[nodiscard]] std::size_t next(std::size_t at) const { return (at + 1) & mask(); }
  [[nodiscard]] std::size_t home(const void* memory) const {
    return ((reinterpret_cast<std::uintptr_t>(memory) >> 4) * std::uintptr_t{0x9E3779B1} >> 8) & mask();
  }
  [[nodiscard]] std::size_t slot_of(const void* memory) const {
    std::size_t at = home(memory);
    while (slots_[at].memory != nullptr && slots_[at].memory != memory) at = next(at);
    return at;
  }
  void grow() {
    std::vector<heap_block> old(slots_.size() * 2);
    old.swap(slots_);
    for (const heap_block& block : old) {
      if (block.memory != nullptr) slots_[slot_of(block.memory)] = block;
    }
  }

  std::vector<heap_block> slots_;
  std::size_t used_ = 0;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_BLOCK_TABLE_H_
