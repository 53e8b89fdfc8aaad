#include "soter/soter_data.h"

#include "platform/bytes.h"

namespace keymaster {

bool vlb_allocate(vlb_t* block, uint32_t length) {
  vlb_free(block);
  secret_bytes bytes;
  if (length == UINT32_MAX || !bytes.allocate(length + 1)) return false;
  *block = {bytes.release(), length};
  return true;
}

void vlb_free(vlb_t* block) {
  secret_bytes owner;
  if (block->buf != nullptr) owner.adopt(block->buf, block->length);
  *block = {nullptr, 0};
}

}  // namespace keymaster
