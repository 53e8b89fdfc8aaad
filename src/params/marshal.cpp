#include "params/marshal.h"

#include <algorithm>
#include <cstring>

#include "platform/bytes.h"
#include "platform/cursor.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t record_size = sizeof(keymaster_key_param_t);

[[nodiscard]] bool is_hidden(keymaster_tag_t tag) {
  return tag == KM_TAG_APPLICATION_ID || tag == KM_TAG_APPLICATION_DATA || tag == KM_TAG_ROOT_OF_TRUST;
}

[[nodiscard]] bool is_written(const keymaster_key_param_t& param, bool include_hidden) {
  return include_hidden || !is_hidden(param.tag);
}

/// Reads one record into `param`, which lies behind the records that the set counts: until it is counted, nobody frees
/// its blob but this function.
TEE_Result unmarshal_record(byte_reader& in, keymaster_key_param_t& param) {
  if (!in.copy_to(&param, record_size)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  if (!tag_has_blob(param.tag)) return TEE_SUCCESS;

  param.blob.data_slot = 0;  // the client's own pointer, which must never be taken for one of ours
  heap_bytes blob;
  if (!blob.allocate(param.blob.data_length)) {
    TRACE_ERROR("Out of memory, require %dB", param.blob.data_length);
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  if (!in.copy_to(blob.data(), param.blob.data_length)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  param.blob.data = blob.release();
  return TEE_SUCCESS;
}

TEE_Result unmarshal_records(std::span<const uint8_t> input, parameter_set& set) {
  byte_reader in{input};
  uint32_t count = 0;
  if (!in.read_u32(count)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  if (count == 0) return TEE_SUCCESS;

  const uint64_t array_size = uint64_t{count} * record_size;
  if (array_size <= UINT32_MAX) {
    set.params =
        static_cast<keymaster_key_param_t*>(TEE_Malloc(static_cast<uint32_t>(array_size), TEE_MALLOC_FILL_ZERO));
  }
  if (set.params == nullptr) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  for (; set.length < count; ++set.length) {
    if (TEE_Result r = unmarshal_record(in, set.params[set.length]); r != TEE_SUCCESS) return r;
  }
  return TEE_SUCCESS;
}

/// Clears four bytes at offset 8 of the data area before a blob is written there, a trait of the format that readers of
/// short blobs see: the blob's bytes cover it, unless they are fewer than 12. It never reaches past the marshalled
/// size.
void clear_reference_remainder(std::span<uint8_t> data_area) {
  constexpr std::size_t offset = 8, size = 4;
  if (data_area.size() <= offset) return;
  const std::span<uint8_t> place = data_area.subspan(offset);
  std::memset(place.data(), 0, std::min(place.size(), size));
}

TEE_Result marshal_record(const keymaster_key_param_t& param, byte_writer& out) {
  keymaster_key_param_t copy = param;
  if (tag_has_blob(param.tag)) copy.blob.data_slot = 0;  // where our heap lies is nobody's business
  if (!out.write_bytes(&copy, record_size)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  if (!tag_has_blob(param.tag)) return TEE_SUCCESS;

  clear_reference_remainder(out.rest());
  if (param.blob.data == nullptr) {
    TRACE_ERROR("Invalid keymaster_key_param_set_t");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (!out.write_bytes(param.blob.data, param.blob.data_length)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  return TEE_SUCCESS;
}

TEE_Result marshal_records(const keymaster_key_param_set_t& set, bool include_hidden, std::span<uint8_t> buffer) {
  byte_writer out{buffer};
  uint32_t count = 0;
  for (const keymaster_key_param_t& param : records(set)) count += is_written(param, include_hidden) ? 1 : 0;
  if (!out.write_u32(count)) {
    TRACE_ERROR("Too short input");
    return TEE_ERROR_GENERIC;
  }
  for (const keymaster_key_param_t& param : records(set)) {
    if (!is_written(param, include_hidden)) continue;
    if (TEE_Result r = marshal_record(param, out); r != TEE_SUCCESS) return r;
  }
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result unmarshal(std::span<const uint8_t> input, keymaster_key_param_set_t* set) {
  if (set == nullptr) return TEE_ERROR_SHORT_BUFFER;
  parameter_set parsed;
  const TEE_Result result = unmarshal_records(input, parsed);
  *set = result == TEE_SUCCESS ? parsed.release() : keymaster_key_param_set_t{nullptr, 0};
  return result;
}

uint32_t marshal_size(const keymaster_key_param_set_t& set, bool include_hidden) {
  uint64_t size = sizeof(uint32_t);
  for (const keymaster_key_param_t& param : records(set)) {
    if (!is_written(param, include_hidden)) continue;
    size += uint64_t{record_size} + (tag_has_blob(param.tag) ? param.blob.data_length : 0);
  }
  return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
}

TEE_Result marshal(const keymaster_key_param_set_t& set, bool include_hidden, uint8_t** buffer, uint32_t* length) {
  const uint32_t size = marshal_size(set, include_hidden);
  const uint32_t capacity = *length;
  uint8_t* const given = *buffer;
  *buffer = nullptr;
  *length = 0;

  heap_bytes own;
  if (given == nullptr && !own.allocate(size)) {
    TRACE_ERROR("Out of memory, need %dB", size);
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  if (given != nullptr && capacity < size) {
    TRACE_ERROR("Too short marshalling buffer");
    // The buffer goes with the failure, as all callers of this interface expect; see the header.
    TEE_Free(given);
    return TEE_ERROR_SHORT_BUFFER;
  }
  uint8_t* const target = given != nullptr ? given : own.data();
  if (TEE_Result r = marshal_records(set, include_hidden, {target, size}); r != TEE_SUCCESS) return r;

  *buffer = target;
  *length = size;
  (void)own.release();
  return TEE_SUCCESS;
}

TEE_Result marshal_to_slot(const keymaster_key_param_set_t& set, std::span<uint8_t> slot, uint32_t* written) {
  *written = 0;
  const uint32_t capacity = static_cast<uint32_t>(std::min<std::size_t>(slot.size(), marshal_size(set, false)));
  uint8_t* const block = allocate_bytes(capacity);
  if (block == nullptr) {
    TRACE_ERROR("Out of memory, need %dB", capacity);
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  uint8_t* buffer = block;
  uint32_t length = capacity;
  const TEE_Result result = marshal(set, false, &buffer, &length);
  if (result == TEE_SUCCESS) {
    std::memcpy(slot.data(), block, length);
    *written = length;
  }
  // A capacity that is too small has already cost the block its life.
  if (result != TEE_ERROR_SHORT_BUFFER) TEE_Free(block);
  return result;
}

}  // namespace keymaster
