#include "tee/server/call_memory.h"

#include <algorithm>
#include <cstring>

namespace hosted_tee {
namespace {

// Both APIs number directions alike, and so does the wire.
std::uint32_t directions(std::uint32_t type) {
  return type & (TEEC_MEM_INPUT | TEEC_MEM_OUTPUT);
}

// What stands in front of the slots in the longest kind of answer.
constexpr std::size_t fixed_part = remote::header_size + 12;

}  // namespace

void call_memory::carry(const remote::request_slot& slot, std::uint32_t type, TEE_Param& param) {
  param.memref.size = slot.size;
  if (!remote::comes_out(type)) {
    param.memref.buffer = const_cast<std::uint8_t*>(slot.data.data());
    return;
  }
  // take has seen that everything that comes out fits into an answer, which is as long as the scratch.
  const std::span<std::uint8_t> place = scratch_.subspan(used_, slot.size);
  used_ += slot.size;
  param.memref.buffer = place.data();
  if (place.empty()) return;
  if (remote::goes_in(type)) {
    std::memcpy(place.data(), slot.data.data(), place.size());
  } else {
    std::memset(place.data(), 0, place.size());
  }
}

bool call_memory::follow(const remote::request_slot& slot, std::uint32_t type, const block_collection& blocks,
                         TEE_Param& param) {
  if (slot.source == remote::memory_source::carried) {
    carry(slot, type, param);
  } else if (slot.source == remote::memory_source::shared) {
    const auto part = blocks.part(slot.block, slot.offset, slot.size, directions(type));
    if (!part) return false;
    param.memref.buffer = part->data();
    param.memref.size = slot.size;
  }
  return true;
}

TEEC_Result call_memory::take(const remote::request_slots& request, const block_collection& blocks) {
  request_ = &request;
  if (remote::answer_size(request) > scratch_.size() - fixed_part) return TEEC_ERROR_EXCESS_DATA;
  for (std::size_t i = 0; i < 4; ++i) {
    const std::uint32_t type = TEE_PARAM_TYPE_GET(request.types, i);
    if (remote::is_value(type)) params_[i].value = {request.slots[i].a, request.slots[i].b};
    if (remote::is_memory(type) && !follow(request.slots[i], type, blocks, params_[i])) {
      return TEEC_ERROR_BAD_PARAMETERS;
    }
  }
  return TEEC_SUCCESS;
}

remote::answer_slots call_memory::answer(bool reached_ta) const {
  remote::answer_slots out;
  out.types = request_->types;
  for (std::size_t i = 0; i < 4; ++i) {
    const std::uint32_t type = TEE_PARAM_TYPE_GET(out.types, i);
    if (!remote::comes_out(type)) continue;
    if (remote::is_value(type)) {
      out.slots[i].a = params_[i].value.a;
      out.slots[i].b = params_[i].value.b;
      continue;
    }
    const remote::request_slot& asked = request_->slots[i];
    out.slots[i].size = params_[i].memref.size;
    if (reached_ta && asked.source == remote::memory_source::carried) {
      out.slots[i].data = {static_cast<const std::uint8_t*>(params_[i].memref.buffer),
                           std::min(params_[i].memref.size, asked.size)};
    }
  }
  return out;
}

}  // namespace hosted_tee
