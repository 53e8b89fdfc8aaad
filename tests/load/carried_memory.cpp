#include "tests/load/carried_memory.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstring>
#include <stdexcept>

#include "tests/support/ta_client.h"

using testing_support::bytes;
using testing_support::canary;

namespace load {
namespace {

// PARTIAL stands as far behind TEMP in the numbers of the Client API, whatever the direction.
constexpr std::uint32_t from_temporary_to_partial = TEEC_MEMREF_PARTIAL_INPUT - TEEC_MEMREF_TEMP_INPUT;

constexpr std::uint32_t flags_of(std::uint32_t type) {
  return type == TEEC_MEMREF_TEMP_INPUT    ? TEEC_MEM_INPUT
         : type == TEEC_MEMREF_TEMP_OUTPUT ? TEEC_MEM_OUTPUT
                                           : TEEC_MEM_INPUT | TEEC_MEM_OUTPUT;
}

}  // namespace

carried_memory::carried_memory(TEEC_Context& context, passage way, const bytes& content, std::uint32_t type)
    : way_(way), type_(type), size_(content.size()) {
  if (way_ == passage::allocated_whole && size_ == 0) way_ = passage::allocated;  // there are no empty blocks
  if (way_ == passage::allocated_whole) margin_ = 0;
  bytes framed(size_ + 2 * margin_, canary);
  std::copy(content.begin(), content.end(), framed.begin() + static_cast<std::ptrdiff_t>(margin_));
  block_.size = framed.size();
  block_.flags = flags_of(type);
  TEEC_Result made = TEEC_SUCCESS;
  if (way_ == passage::temporary || way_ == passage::registered) {
    own_ = std::move(framed);
    block_.buffer = own_.data();
    if (way_ == passage::registered) made = TEEC_RegisterSharedMemory(&context, &block_);
  } else {
    made = TEEC_AllocateSharedMemory(&context, &block_);
    if (made == TEEC_SUCCESS) std::memcpy(block_.buffer, framed.data(), framed.size());
  }
  if (made != TEEC_SUCCESS) throw std::runtime_error(fmt::format("no shared memory: {:#x}", made));
}

carried_memory::~carried_memory() {
  if (way_ != passage::temporary) TEEC_ReleaseSharedMemory(&block_);
}

const std::uint8_t* carried_memory::start() const {
  return static_cast<const std::uint8_t*>(block_.buffer);
}

std::uint32_t carried_memory::type() const {
  if (way_ == passage::temporary) return type_;
  return way_ == passage::allocated_whole ? TEEC_MEMREF_WHOLE : type_ + from_temporary_to_partial;
}

void carried_memory::refer(TEEC_Parameter& slot) {
  if (way_ == passage::temporary) {
    slot.tmpref = {own_.data() + margin_, size_};
  } else {
    slot.memref = {&block_, size_, margin_};
  }
}

std::size_t carried_memory::size(const TEEC_Parameter& slot) const {
  return way_ == passage::temporary ? slot.tmpref.size : slot.memref.size;
}

bytes carried_memory::content() const {
  const std::uint8_t* const end = start() + block_.size;
  const auto is_canary = [](std::uint8_t byte) { return byte == canary; };
  if (!std::all_of(start(), start() + margin_, is_canary) || !std::all_of(end - margin_, end, is_canary)) {
    throw std::runtime_error("bytes around a buffer were written to");
  }
  return {start() + margin_, end - margin_};
}

}  // namespace load
