#include "tee/companions/fingerprint/finger_list.h"

#include <cstring>

#include "platform/byte_order.h"
#include "platform/cursor.h"
#include "platform/trace.h"
#include "tee/companions/common/stored_object.h"
#include "tee/companions/fingerprint/fingerprint_protocol.h"

namespace keymaster::fingerprint {
namespace {

constexpr std::string_view list_name = "fp.templates";
constexpr uint32_t header_size = sizeof(uint32_t);
constexpr uint32_t largest_list = header_size + finger_limit * finger_record_size;
static_assert(finger_record_size == sizeof(uint32_t) + sizeof(uint64_t));

/// The largest number is left out: in the Keymaster TA's statements it stands for "no finger".
constexpr uint32_t last_finger_id = 0xFFFFFFFE;

bool is_list(uint32_t size) {
  return size >= header_size && size <= largest_list && (size - header_size) % finger_record_size == 0;
}

}  // namespace

TEE_Result finger_list::load() {
  size_ = 0;
  if (!object_.allocate(largest_list)) return TEE_ERROR_OUT_OF_MEMORY;
  secret_bytes stored;
  // One byte more, which shows an object that is too long.
  const TEE_Result result = companion::read_stored(list_name, largest_list + 1, stored);
  if (result == TEE_ERROR_ITEM_NOT_FOUND) {
    size_ = header_size;
    return TEE_SUCCESS;
  }
  if (result != TEE_SUCCESS) return result;
  if (!is_list(stored.size())) {
    TRACE_ERROR("The stored list of fingers has %u bytes\n", stored.size());
    return TEE_ERROR_BAD_STATE;
  }
  size_ = stored.size();
  std::memcpy(object_.data(), stored.data(), size_);
  return TEE_SUCCESS;
}

TEE_Result finger_list::enrol(uint64_t secure_id, uint32_t* finger) {
  const uint32_t last = load_u32(object_.data());
  byte_writer end{object_.span().subspan(size_)};
  if (last >= last_finger_id || end.remaining() < finger_record_size) {
    TRACE_ERROR("No room for another finger\n");
    return TEE_ERROR_OVERFLOW;
  }
  const uint32_t next = last + 1;
  byte_writer header{object_.span().first(header_size)};
  if (!header.write_u32(next) || !end.write_u32(next) || !end.write_bytes(&secure_id, sizeof secure_id)) {
    return TEE_ERROR_BAD_STATE;
  }
  size_ += finger_record_size;
  if (TEE_Result r = store(); r != TEE_SUCCESS) return r;
  *finger = next;
  return TEE_SUCCESS;
}

TEE_Result finger_list::remove(uint32_t finger) {
  uint32_t offset = 0;
  if (TEE_Result r = place_of(finger, &offset); r != TEE_SUCCESS) return r;
  uint8_t* const place = object_.data() + offset;
  std::memmove(place, place + finger_record_size, size_ - offset - finger_record_size);
  size_ -= finger_record_size;
  return store();
}

TEE_Result finger_list::find(uint32_t finger, uint64_t* secure_id) const {
  uint32_t offset = 0;
  if (TEE_Result r = place_of(finger, &offset); r != TEE_SUCCESS) return r;
  *secure_id = load_u64(object_.data() + offset + sizeof finger);
  return TEE_SUCCESS;
}

std::span<const uint8_t> finger_list::records() const {
  return object_.span().subspan(header_size, size_ - header_size);
}

TEE_Result finger_list::place_of(uint32_t finger, uint32_t* offset) const {
  for (uint32_t at = header_size; at < size_; at += finger_record_size) {
    if (load_u32(object_.data() + at) != finger) continue;
    *offset = at;
    return TEE_SUCCESS;
  }
  TRACE_ERROR("No finger %u\n", finger);
  return TEE_ERROR_ITEM_NOT_FOUND;
}

TEE_Result finger_list::store() const {
  return companion::write_stored(list_name, object_.span().first(size_));
}

}  // namespace keymaster::fingerprint
