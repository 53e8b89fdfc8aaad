#include "tee/crypto/call.h"

#include <cstring>

namespace hosted_tee {

void output::put(bytes_view bytes) const {
  std::uint8_t* const place = room(bytes.size());
  if (!bytes.empty()) std::memcpy(place, bytes.data(), bytes.size());
  written(bytes.size());
}

}  // namespace hosted_tee
