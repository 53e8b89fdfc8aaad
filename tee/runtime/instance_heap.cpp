#include "tee/runtime/instance_heap.h"

#include <openssl/crypto.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <new>

namespace hosted_tee {
namespace {

constexpr int fill_pattern = 0xA5;  // easy to see in a debugger, and wrong as a length, a pointer or a string

std::uint64_t charge(std::uint32_t size) {
  return ((std::uint64_t{size} + 7) & ~std::uint64_t{7}) + instance_heap::block_overhead;
}

}  // namespace

instance_heap::instance_heap(std::uint32_t limit) : limit_(limit) {}

// What is left belonged to a TA that panicked or forgot it; it may be secret.
instance_heap::~instance_heap() {
  for (const heap_block& block : blocks_.slots()) {
    if (block.memory != nullptr) OPENSSL_cleanse(block.memory, block.size);
    std::free(block.memory);
  }
}

void* instance_heap::take(std::uint32_t size, bool zero, std::uint64_t bytes_after) {
  if (bytes_after > limit_) return nullptr;
  void* block = std::malloc(std::max(size, 1U));
  if (block == nullptr) return nullptr;
  try {
    blocks_.insert({block, size, zero});
  } catch (const std::bad_alloc&) {
    std::free(block);
    return nullptr;
  }
  std::memset(block, zero ? 0 : fill_pattern, size);
  bytes_ = static_cast<std::uint32_t>(bytes_after);
  peak_ = std::max(peak_, bytes_);
  span_peak_ = std::max(span_peak_, bytes_);
  return block;
}

void* instance_heap::allocate(std::uint32_t size, bool zero) {
  return take(size, zero, bytes_ + charge(size));
}

void instance_heap::release(const heap_block& block) {
  if (on_free_) on_free_({static_cast<const std::uint8_t*>(block.memory), block.size});
  blocks_.erase(block.memory);
  std::free(block.memory);
}

void* instance_heap::reallocate(void* block, std::uint32_t new_size) {
  const heap_block* found = blocks_.find(block);
  if (found == nullptr) return nullptr;
  const heap_block old = *found;
  void* moved = take(new_size, old.zero, bytes_ + charge(new_size));
  if (moved == nullptr) return nullptr;
  std::memcpy(moved, block, std::min(old.size, new_size));
  bytes_ -= static_cast<std::uint32_t>(charge(old.size));
  release(old);
  return moved;
}

bool instance_heap::free(void* block) {
  const heap_block* found = blocks_.find(block);
  if (found == nullptr) return false;
  const heap_block old = *found;
  bytes_ -= static_cast<std::uint32_t>(charge(old.size));
  release(old);
  return true;
}

bool instance_heap::owns(const void* block) const {
  return blocks_.find(block) != nullptr;
}

}  // namespace hosted_tee
