// Shared memory of the Client API 1.0 (4.5.4 to 4.5.6). The embedded TEE shares all memory with its client; what is
// left is to keep the rules.
#include <algorithm>
#include <cstdlib>

#include "tee_client_api.h"

namespace {

TEEC_Result check(const TEEC_Context* context, const TEEC_SharedMemory* memory) {
  constexpr uint32_t known = TEEC_MEM_INPUT | TEEC_MEM_OUTPUT;
  if (context == nullptr || context->imp == nullptr || memory == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
  if (memory->flags == 0 || (memory->flags & ~known) != 0) return TEEC_ERROR_BAD_PARAMETERS;
  return memory->size > TEEC_CONFIG_SHAREDMEM_MAX_SIZE ? TEEC_ERROR_OUT_OF_MEMORY : TEEC_SUCCESS;
}

}  // namespace

extern "C" {

TEEC_Result TEEC_RegisterSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem) {
  if (const TEEC_Result result = check(context, sharedMem); result != TEEC_SUCCESS) return result;
  if (sharedMem->buffer == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
  sharedMem->imp = {context->imp, nullptr};
  return TEEC_SUCCESS;
}

TEEC_Result TEEC_AllocateSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem) {
  if (const TEEC_Result result = check(context, sharedMem); result != TEEC_SUCCESS) return result;
  void* block = std::calloc(std::max<std::size_t>(sharedMem->size, 1), 1);  // an empty block has an address too
  if (block == nullptr) return TEEC_ERROR_OUT_OF_MEMORY;
  sharedMem->buffer = block;
  sharedMem->imp = {context->imp, block};
  return TEEC_SUCCESS;
}

void TEEC_ReleaseSharedMemory(TEEC_SharedMemory* sharedMem) {
  if (sharedMem == nullptr || sharedMem->imp.context == nullptr) return;
  if (sharedMem->imp.allocated != nullptr) {
    std::free(sharedMem->imp.allocated);
    sharedMem->buffer = nullptr;
    sharedMem->size = 0;
  }
  sharedMem->imp = {nullptr, nullptr};
}

}  // extern "C"
