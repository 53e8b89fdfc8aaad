// Shared memory of the Client API 1.0 (4.5.4 to 4.5.6): the rules, which are the same whatever is behind the context.
#include "tee/client/call.h"
#include "tee/client/connection.h"
#include "tee_client_api.h"

namespace hosted_tee {
namespace {

void check(const TEEC_Context* context, const TEEC_SharedMemory* memory) {
  constexpr std::uint32_t known = TEEC_MEM_INPUT | TEEC_MEM_OUTPUT;
  if (context == nullptr || context->imp == nullptr || memory == nullptr) {
    throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  }
  if (memory->flags == 0 || (memory->flags & ~known) != 0) throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  if (memory->size > TEEC_CONFIG_SHAREDMEM_MAX_SIZE) throw client_failure(TEEC_ERROR_OUT_OF_MEMORY);
}

tee_link& link_of(const TEEC_Context& context) {
  return *static_cast<client_context*>(context.imp)->tee;
}

}  // namespace

extern "C" {

TEEC_Result TEEC_RegisterSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem) {
  return client_call(nullptr, [&]() -> TEEC_Result {
    check(context, sharedMem);
    if (sharedMem->buffer == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    sharedMem->imp = {context->imp, link_of(*context).share_own(*sharedMem).release()};
    return TEEC_SUCCESS;
  });
}

TEEC_Result TEEC_AllocateSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem) {
  return client_call(nullptr, [&]() -> TEEC_Result {
    if (sharedMem != nullptr) {  // what a failure leaves (4.5.5)
      sharedMem->buffer = nullptr;
      sharedMem->imp = {nullptr, nullptr};
    }
    check(context, sharedMem);
    std::unique_ptr<shared_block> block = link_of(*context).share_new(*sharedMem);
    sharedMem->buffer = block->allocated();
    sharedMem->imp = {context->imp, block.release()};
    return TEEC_SUCCESS;
  });
}

void TEEC_ReleaseSharedMemory(TEEC_SharedMemory* sharedMem) {
  if (sharedMem == nullptr || sharedMem->imp.context == nullptr) return;
  const std::unique_ptr<shared_block> block(static_cast<shared_block*>(sharedMem->imp.block));
  if (block != nullptr && block->allocated() != nullptr) {
    sharedMem->buffer = nullptr;
    sharedMem->size = 0;
  }
  sharedMem->imp = {nullptr, nullptr};
}

}  // extern "C"
}  // namespace hosted_tee
