#include "tee/companions/common/fixed_object.h"

#include <algorithm>
#include <cstring>

#include "platform/byte_order.h"
#include "platform/trace.h"
#include "platform/wipe.h"
#include "tee/companions/common/stored_object.h"

namespace keymaster::companion {

TEE_Result read_fixed(std::string_view name, std::span<uint8_t> value) {
  secret_bytes stored;
  // One byte more, which shows an object that is too long.
  if (TEE_Result r = read_stored(name, static_cast<uint32_t>(value.size()) + 1, stored); r != TEE_SUCCESS) return r;
  if (stored.size() != value.size()) {
    TRACE_ERROR("A stored object has %u bytes or more instead of %u\n", stored.size(),
                static_cast<uint32_t>(value.size()));
    return TEE_ERROR_BAD_STATE;
  }
  std::memcpy(value.data(), stored.data(), value.size());
  return TEE_SUCCESS;
}

TEE_Result draw_once(std::string_view name, std::span<uint8_t> value) {
  TEE_Result result = read_fixed(name, value);
  if (result == TEE_ERROR_ITEM_NOT_FOUND) {
    draw(value);
    result = write_stored(name, value);
  }
  if (result != TEE_SUCCESS) wipe(value.data(), value.size());
  return result;
}

TEE_Result draw_id_once(std::string_view name, uint64_t* id) {
  wiped_array<sizeof *id> value;
  const TEE_Result result = draw_once(name, value.bytes);
  *id = load_u64(value.bytes);
  return result;
}

void draw(std::span<uint8_t> value) {
  do {
    TEE_GenerateRandom(value.data(), static_cast<uint32_t>(value.size()));
  } while (std::all_of(value.begin(), value.end(), [](uint8_t byte) { return byte == 0; }));
}

}  // namespace keymaster::companion
