// The heap of one instance: bounded by its gpd.ta.dataSize, counted to the byte, reclaimed whole when it ends.
#ifndef TEE_RUNTIME_INSTANCE_HEAP_H_
#define TEE_RUNTIME_INSTANCE_HEAP_H_

#include <cstdint>
#include <functional>
#include <span>
#include <utility>

#include "tee/runtime/block_table.h"

namespace hosted_tee {

/// Each block comes from the host's allocator (so that the address sanitizer watches it) and is charged its size
/// rounded up to 8 bytes plus block_overhead. New bytes are zero for hint 0 and a fixed pattern otherwise; a block
/// keeps its hint when it is reallocated. A zero-size block is a block. A pointer that the heap did not hand out is
/// recognised. Reallocation always moves, so that the address sanitizer sees every use of the old block; while it
/// moves, both blocks are charged.
class instance_heap {
 public:
  static constexpr std::uint32_t block_overhead = 16;
  using inspector = std::function<void(std::span<const std::uint8_t>)>;

  explicit instance_heap(std::uint32_t limit);
  ~instance_heap();
  instance_heap(const instance_heap&) = delete;
  instance_heap& operator=(const instance_heap&) = delete;

  [[nodiscard]] void* allocate(std::uint32_t size, bool zero);          ///< null when the limit would be passed
  [[nodiscard]] void* reallocate(void* block, std::uint32_t new_size);  ///< of an owned block; null: it stays
  [[nodiscard]] bool free(void* block);                                 ///< false: not a block of this heap
  [[nodiscard]] bool owns(const void* block) const;

  void set_inspector(inspector on_free) { on_free_ = std::move(on_free); }
  [[nodiscard]] std::uint32_t bytes() const { return bytes_; }
  [[nodiscard]] std::uint32_t blocks() const { return static_cast<std::uint32_t>(blocks_.size()); }
  [[nodiscard]] std::uint32_t peak() const { return peak_; }

  /// begin_span begins a stretch of time, such as a command; span_peak is the highest bytes() since then.
  void begin_span() { span_peak_ = bytes_; }
  [[nodiscard]] std::uint32_t span_peak() const { return span_peak_; }
  [[nodiscard]] std::uint32_t limit() const { return limit_; }

 private:
  void release(const heap_block& block);
  [[nodiscard]] void* take(std::uint32_t size, bool zero, std::uint64_t bytes_after);

  block_table blocks_;
  inspector on_free_;
  std::uint32_t limit_;
  std::uint32_t bytes_ = 0;
  std::uint32_t peak_ = 0;
  std::uint32_t span_peak_ = 0;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_INSTANCE_HEAP_H_
