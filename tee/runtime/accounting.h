// What an instance holds, as numbers that a test can compare before and after.
#ifndef TEE_RUNTIME_ACCOUNTING_H_
#define TEE_RUNTIME_ACCOUNTING_H_

#include <cstdint>

namespace hosted_tee {

struct accounting {
  std::uint32_t heap_bytes = 0;   ///< bytes in use, overhead of each block included
  std::uint32_t heap_blocks = 0;  ///< blocks in use
  std::uint32_t heap_peak = 0;    ///< highest heap_bytes since the instance began
  std::uint32_t transient_objects = 0;
  std::uint32_t persistent_objects = 0;  ///< open handles
  std::uint32_t operations = 0;

  /// same_holdings compares everything but the peak.
  [[nodiscard]] bool same_holdings(const accounting& other) const {
    return heap_bytes == other.heap_bytes && heap_blocks == other.heap_blocks &&
           transient_objects == other.transient_objects && persistent_objects == other.persistent_objects &&
           operations == other.operations;
  }
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_ACCOUNTING_H_
