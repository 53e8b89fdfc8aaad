#include "tee/remote/parameters.h"

#include "tee_api_constants.h"

namespace hosted_tee::remote {
namespace {

// Both kinds of slots number their directions alike: 1 in, 2 out, and memory has 4 beside it.
constexpr std::uint32_t in_flag = 1, out_flag = 2, memory_flag = 4;
static_assert(TEE_PARAM_TYPE_VALUE_INOUT == (in_flag | out_flag));
static_assert(TEE_PARAM_TYPE_MEMREF_INPUT == (memory_flag | in_flag));
static_assert(TEE_PARAM_TYPE_MEMREF_OUTPUT == (memory_flag | out_flag));

constexpr std::uint32_t all_types = 0xFFFF;

std::uint32_t type_of(std::uint32_t types, std::size_t slot) {
  return types >> (4 * slot) & 0xFU;
}

bool read_memory(frame_reader& in, std::uint32_t type, request_slot& out) {
  std::uint32_t source = 0;
  if (!in.number(source)) return false;
  switch (static_cast<memory_source>(source)) {
    case memory_source::carried:
      out.source = memory_source::carried;
      return in.number(out.size) && (!goes_in(type) || in.bytes(out.size, out.data));
    case memory_source::shared:
      out.source = memory_source::shared;
      return in.number(out.block) && in.number(out.offset) && in.number(out.size);
    case memory_source::absent:
      out.source = memory_source::absent;
      return true;
  }
  return false;
}

void write_memory(frame_writer& out, std::uint32_t type, const request_slot& slot) {
  out.number(static_cast<std::uint32_t>(slot.source));
  if (slot.source == memory_source::shared) {
    out.number(slot.block);
    out.number(slot.offset);
    out.number(slot.size);
  } else if (slot.source == memory_source::carried) {
    out.number(slot.size);
    if (goes_in(type)) out.bytes(slot.data);
  }
}

bool read_types(frame_reader& in, std::uint32_t& types) {
  return in.number(types) && are_slot_types(types);
}

}  // namespace

bool is_value(std::uint32_t type) {
  return type != 0 && (type & memory_flag) == 0;
}
bool is_memory(std::uint32_t type) {
  return (type & memory_flag) != 0;
}
bool goes_in(std::uint32_t type) {
  return (type & in_flag) != 0;
}
bool comes_out(std::uint32_t type) {
  return (type & out_flag) != 0;
}

bool are_slot_types(std::uint32_t types) {
  for (std::size_t i = 0; i < 4; ++i) {
    const std::uint32_t type = type_of(types, i);
    if (type > TEE_PARAM_TYPE_MEMREF_INOUT || type == memory_flag) return false;
  }
  return (types & ~all_types) == 0;
}

bool read(frame_reader& in, request_slots& out) {
  if (!read_types(in, out.types)) return false;
  for (std::size_t i = 0; i < out.slots.size(); ++i) {
    const std::uint32_t type = type_of(out.types, i);
    request_slot& slot = out.slots[i];
    if (is_memory(type) && !read_memory(in, type, slot)) return false;
    if (is_value(type) && goes_in(type) && !(in.number(slot.a) && in.number(slot.b))) return false;
  }
  return true;
}

void write(frame_writer& out, const request_slots& slots) {
  out.number(slots.types);
  for (std::size_t i = 0; i < slots.slots.size(); ++i) {
    const std::uint32_t type = type_of(slots.types, i);
    const request_slot& slot = slots.slots[i];
    if (is_memory(type)) write_memory(out, type, slot);
    if (is_value(type) && goes_in(type)) {
      out.number(slot.a);
      out.number(slot.b);
    }
  }
}

bool read(frame_reader& in, answer_slots& out) {
  if (!read_types(in, out.types)) return false;
  for (std::size_t i = 0; i < out.slots.size(); ++i) {
    const std::uint32_t type = type_of(out.types, i);
    answer_slot& slot = out.slots[i];
    if (!comes_out(type)) continue;
    if (is_value(type)) {
      if (!in.number(slot.a) || !in.number(slot.b)) return false;
      continue;
    }
    std::uint32_t carried = 0;
    if (!in.number(slot.size) || !in.number(carried) || !in.bytes(carried, slot.data)) return false;
  }
  return true;
}

void write(frame_writer& out, const answer_slots& slots) {
  out.number(slots.types);
  for (std::size_t i = 0; i < slots.slots.size(); ++i) {
    const std::uint32_t type = type_of(slots.types, i);
    const answer_slot& slot = slots.slots[i];
    if (!comes_out(type)) continue;
    out.number(is_value(type) ? slot.a : slot.size);
    out.number(is_value(type) ? slot.b : static_cast<std::uint32_t>(slot.data.size()));
    if (is_memory(type)) out.bytes(slot.data);
  }
}

std::uint64_t answer_size(const request_slots& slots) {
  constexpr std::uint64_t two_words = 8;
  std::uint64_t size = sizeof slots.types;  // the client's four lengths of 32 bits
  for (std::size_t i = 0; i < slots.slots.size(); ++i) {
    const std::uint32_t type = type_of(slots.types, i);
    if (!comes_out(type)) continue;
    size += two_words;
    if (is_memory(type) && slots.slots[i].source == memory_source::carried) size += slots.slots[i].size;
  }
  return size;
}

}  // namespace hosted_tee::remote
