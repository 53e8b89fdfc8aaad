// Owners of heap memory. The TEE heap is the only one there is, and every allocation can fail.
#ifndef KEYMASTER_PLATFORM_BYTES_H_
#define KEYMASTER_PLATFORM_BYTES_H_

#include <cstdint>
#include <cstring>
#include <new>
#include <span>
#include <type_traits>
#include <utility>

#include "platform/wipe.h"
#include "tee_internal_api.h"

namespace keymaster {

/// allocate_bytes hands out `size` zero bytes, or null when the heap is exhausted. A size of 0 gives a block too:
/// whether TEE_Malloc answers null for 0 bytes is the platform's choice, and null must only ever mean "out of memory".
[[nodiscard]] inline uint8_t* allocate_bytes(uint32_t size) {
  return static_cast<uint8_t*>(TEE_Malloc(size == 0 ? 1 : size, TEE_MALLOC_FILL_ZERO));
}

/// allocate_records hands out `count` records of zero bytes, or null. TEE_Malloc aligns a block for any of them.
template <class Record>
[[nodiscard]] Record* allocate_records(uint32_t count) {
  static_assert(std::is_trivial_v<Record>, "nothing constructs or destroys them");
  void* const memory = allocate_bytes(count * sizeof(Record));
  return static_cast<Record*>(memory);
}

/// basic_bytes owns one heap block of a fixed size. Empty: no block. Secret blocks are wiped before they are freed.
template <bool Secret>
class basic_bytes {
 public:
  basic_bytes() = default;
  basic_bytes(basic_bytes&& other) noexcept
      : data_(std::exchange(other.data_, nullptr)), size_(std::exchange(other.size_, 0)) {}
  basic_bytes& operator=(basic_bytes&& other) noexcept {
    if (this != &other) {
      reset();
      data_ = std::exchange(other.data_, nullptr);
      size_ = std::exchange(other.size_, 0);
    }
    return *this;
  }
  basic_bytes(const basic_bytes&) = delete;
  basic_bytes& operator=(const basic_bytes&) = delete;
  ~basic_bytes() { reset(); }

  /// allocate replaces the content by `size` zero bytes. False: out of memory, and the owner is empty.
  [[nodiscard]] bool allocate(uint32_t size) {
    reset();
    data_ = allocate_bytes(size);
    size_ = data_ == nullptr ? 0 : size;
    return data_ != nullptr;
  }

  /// copy_of replaces the content by a copy of `source`, which is read exactly once: it may be memory that the normal
  /// world changes meanwhile, so nothing that is decided on the copy may be read again from there.
  [[nodiscard]] bool copy_of(std::span<const uint8_t> source) {
    if (!allocate(static_cast<uint32_t>(source.size()))) return false;
    if (!source.empty()) std::memcpy(data_, source.data(), source.size());
    asm volatile("" : : "r"(data_) : "memory");
    return true;
  }

  void reset() {
    if (data_ == nullptr) return;
    if constexpr (Secret) wipe(data_, size_);
    TEE_Free(std::exchange(data_, nullptr));
    size_ = 0;
  }

  /// adopt takes over a block of `size` bytes that came from the TEE heap.
  void adopt(uint8_t* block, uint32_t size) {
    reset();
    data_ = block;
    size_ = size;
  }

  /// shorten gives up all but the first `size` bytes; the block stays as it is, and the rest of it is wiped.
  void shorten(uint32_t size) {
    if (size >= size_) return;
    wipe(data_ + size, size_ - size);
    size_ = size;
  }

  /// release hands the block on; the new owner frees it with TEE_Free.
  [[nodiscard]] uint8_t* release() {
    size_ = 0;
    return std::exchange(data_, nullptr);
  }

  [[nodiscard]] explicit operator bool() const { return data_ != nullptr; }
  [[nodiscard]] uint8_t* data() { return data_; }
  [[nodiscard]] const uint8_t* data() const { return data_; }
  [[nodiscard]] uint32_t size() const { return size_; }
  [[nodiscard]] std::span<uint8_t> span() { return {data_, size_}; }
  [[nodiscard]] std::span<const uint8_t> span() const { return {data_, size_}; }

 private:
  uint8_t* data_ = nullptr;
  uint32_t size_ = 0;
};

using heap_bytes = basic_bytes<false>;
using secret_bytes = basic_bytes<true>;

/// new_record makes a value-initialised `Record` on the heap, or null. delete_record destroys it (its members free what
/// they own), wipes its memory and frees it.
template <class Record>
[[nodiscard]] Record* new_record() {
  void* memory = allocate_bytes(sizeof(Record));
  return memory == nullptr ? nullptr : new (memory) Record();
}

template <class Record>
void delete_record(Record* record) {
  if (record == nullptr) return;
  record->~Record();
  wipe(record, sizeof(Record));
  TEE_Free(record);
}

}  // namespace keymaster

#endif  // KEYMASTER_PLATFORM_BYTES_H_
