#include "soter/soter_init.h"

namespace keymaster {

TEE_Result soter_ensure_ready() {
  return TEE_ERROR_NOT_IMPLEMENTED;
}

bool soter_ready() {
  return false;
}

void soter_release() {}

}  // namespace keymaster
