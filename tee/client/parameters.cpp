#include "tee/client/parameters.h"

#include <limits>

#include "tee/client/client_failure.h"
#include "tee/client/tee_link.h"

namespace hosted_tee {
namespace {

// Both APIs number a memory reference's directions alike: 4 and the two flags of shared memory.
constexpr std::uint32_t memref = 4;
constexpr std::uint32_t directions = TEEC_MEM_INPUT | TEEC_MEM_OUTPUT;
static_assert((memref | TEEC_MEM_INPUT) == TEE_PARAM_TYPE_MEMREF_INPUT);
static_assert((memref | TEEC_MEM_OUTPUT) == TEE_PARAM_TYPE_MEMREF_OUTPUT);
static_assert((memref | directions) == TEE_PARAM_TYPE_MEMREF_INOUT);

[[noreturn]] void bad_parameters() {
  throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
}

bool is_value(std::uint32_t type) {
  return type >= TEEC_VALUE_INPUT && type <= TEEC_VALUE_INOUT;
}
bool is_temporary(std::uint32_t type) {
  return type >= TEEC_MEMREF_TEMP_INPUT && type <= TEEC_MEMREF_TEMP_INOUT;
}
bool is_registered(std::uint32_t type) {
  return type >= TEEC_MEMREF_WHOLE && type <= TEEC_MEMREF_PARTIAL_INOUT;
}

TEE_Param memory(void* buffer, std::size_t size) {
  if (size > std::numeric_limits<std::uint32_t>::max()) throw client_failure(TEEC_ERROR_EXCESS_DATA);
  if (buffer == nullptr && size != 0) bad_parameters();
  TEE_Param slot{};
  slot.memref.buffer = buffer;
  slot.memref.size = static_cast<std::uint32_t>(size);
  return slot;
}

// A null buffer alone makes the null reference (Client API 1.0, 4.3.6): its size is not looked at.
TEE_Param temporary(const TEEC_TempMemoryReference& given) {
  return memory(given.buffer, given.buffer == nullptr ? 0 : given.size);
}

const shared_block& block_of(const TEEC_RegisteredMemoryReference& reference, const tee_link& link) {
  const auto& block = *static_cast<const shared_block*>(reference.parent->imp.block);
  if (block.owner().get() != &link) bad_parameters();
  return block;
}

const TEEC_SharedMemory& shared_memory(const TEEC_RegisteredMemoryReference& reference) {
  const TEEC_SharedMemory* parent = reference.parent;
  if (parent == nullptr || parent->imp.context == nullptr) bad_parameters();
  return *parent;
}

std::uint32_t whole_type(const TEEC_RegisteredMemoryReference& reference) {
  return memref | (shared_memory(reference).flags & directions);
}

TEE_Param part(const TEEC_RegisteredMemoryReference& reference, std::uint32_t type) {
  const TEEC_SharedMemory& parent = shared_memory(reference);
  if (type == TEEC_MEMREF_WHOLE) return memory(parent.buffer, parent.size);
  const std::uint32_t wanted = type & directions;
  if ((parent.flags & wanted) != wanted) bad_parameters();
  if (reference.offset > parent.size || reference.size > parent.size - reference.offset) bad_parameters();
  return memory(static_cast<std::uint8_t*>(parent.buffer) + reference.offset, reference.size);
}

}  // namespace

client_params::client_params(TEEC_Operation* operation, const tee_link& link) : operation_(operation) {
  if (operation_ == nullptr) return;
  if (operation_->paramTypes > 0xFFFF) bad_parameters();
  for (unsigned i = 0; i < 4; ++i) {
    const std::uint32_t type = TEEC_PARAM_TYPE_GET(operation_->paramTypes, i);
    const TEEC_Parameter& given = operation_->params[i];
    std::uint32_t slot_type = type;
    if (is_value(type)) {
      slots_[i].value.a = given.value.a;
      slots_[i].value.b = given.value.b;
    } else if (is_temporary(type)) {
      slots_[i] = temporary(given.tmpref);
    } else if (is_registered(type)) {
      slots_[i] = part(given.memref, type);
      blocks_[i] = &block_of(given.memref, link);
      slot_type = type == TEEC_MEMREF_WHOLE ? whole_type(given.memref) : memref | (type & directions);
    } else if (type != TEEC_NONE) {
      bad_parameters();
    }
    types_ |= slot_type << (4 * i);
  }
}

void client_params::hand_back() const {
  if (operation_ == nullptr) return;
  for (unsigned i = 0; i < 4; ++i) {
    const std::uint32_t type = TEEC_PARAM_TYPE_GET(operation_->paramTypes, i);
    const std::uint32_t slot_type = TEE_PARAM_TYPE_GET(types_, i);
    TEEC_Parameter& taken = operation_->params[i];
    if (type == TEEC_VALUE_OUTPUT || type == TEEC_VALUE_INOUT) {
      taken.value = {slots_[i].value.a, slots_[i].value.b};
    } else if (slot_type == TEE_PARAM_TYPE_MEMREF_OUTPUT || slot_type == TEE_PARAM_TYPE_MEMREF_INOUT) {
      (is_temporary(type) ? taken.tmpref.size : taken.memref.size) = slots_[i].memref.size;
    }
  }
}

}  // namespace hosted_tee
