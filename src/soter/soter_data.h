// Bytes of any length in the records that live as long as the instance. These have no destructors: an image runs
// nothing at its end, and who fills a record empties it.
#ifndef KEYMASTER_SOTER_SOTER_DATA_H_
#define KEYMASTER_SOTER_SOTER_DATA_H_

#include <cstdint>

namespace keymaster {

/// A heap block and how many bytes of it count. Empty: no block, length 0. A zero byte stands behind the bytes, so that
/// they can be read as text.
struct vlb_t {
  uint8_t* buf;
  uint32_t length;
};

/// vlb_allocate gives `block` `length` zero bytes, and a NUL behind them, in place of what it holds. False: out of
/// memory, and `block` is empty.
[[nodiscard]] bool vlb_allocate(vlb_t* block, uint32_t length);

/// vlb_free wipes and frees `block`, and leaves it empty. An empty one is allowed.
void vlb_free(vlb_t* block);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_DATA_H_
