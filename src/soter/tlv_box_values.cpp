// The puts and gets by type, over tlv_box_putobject and the list of entries.
#include <cstring>

#include "soter/text.h"
#include "soter/tlv_box.h"

namespace keymaster {
namespace {

const tlv_entry* find(const tlv_box* box, uint16_t tag) {
  void* entry = nullptr;
  return key_list_get(box->entries, tag, &entry) == 0 ? static_cast<const tlv_entry*>(entry) : nullptr;
}

/// Copies a number from the start of the value; the value's block is as wide as the widest number at least.
template <class Number>
int get_number(const tlv_box* box, uint16_t tag, Number* out) {
  const tlv_entry* const entry = find(box, tag);
  if (entry == nullptr) return -1;
  std::memcpy(out, entry->value.data(), sizeof *out);
  return 0;
}

}  // namespace

int tlv_box_put_char(tlv_box* box, uint16_t tag, int8_t value) {
  return tlv_box_putobject(box, tag, &value, sizeof value);
}

int tlv_box_put_short(tlv_box* box, uint16_t tag, int16_t value) {
  return tlv_box_putobject(box, tag, &value, sizeof value);
}

int tlv_box_put_int(tlv_box* box, uint16_t tag, int32_t value) {
  return tlv_box_putobject(box, tag, &value, sizeof value);
}

int tlv_box_put_long(tlv_box* box, uint16_t tag, int32_t value) {
  return tlv_box_putobject(box, tag, &value, sizeof value);
}

int tlv_box_put_longlong(tlv_box* box, uint16_t tag, int64_t value) {
  return tlv_box_putobject(box, tag, &value, sizeof value);
}

int tlv_box_put_float(tlv_box* box, uint16_t tag, float value) {
  return tlv_box_putobject(box, tag, &value, sizeof value);
}

int tlv_box_put_double(tlv_box* box, uint16_t tag, double value) {
  return tlv_box_putobject(box, tag, &value, sizeof value);
}

int tlv_box_put_string(tlv_box* box, uint16_t tag, const char* value) {
  if (value == nullptr) return -1;
  const uint32_t length = text_length(value);
  return length < tlv_longest_value ? tlv_box_putobject(box, tag, value, length + 1) : -1;
}

int tlv_box_put_bytes(tlv_box* box, uint16_t tag, const void* bytes, uint32_t length) {
  return tlv_box_putobject(box, tag, bytes, length);
}

int tlv_box_put_object(tlv_box* box, uint16_t tag, const tlv_box* other) {
  if (other == nullptr || !other->frozen) return -1;
  return tlv_box_putobject(box, tag, other->buffer.data(), other->size);
}

int tlv_box_get_char(const tlv_box* box, uint16_t tag, int8_t* out) {
  return get_number(box, tag, out);
}

int tlv_box_get_short(const tlv_box* box, uint16_t tag, int16_t* out) {
  return get_number(box, tag, out);
}

int tlv_box_get_int(const tlv_box* box, uint16_t tag, int32_t* out) {
  return get_number(box, tag, out);
}

int tlv_box_get_long(const tlv_box* box, uint16_t tag, int32_t* out) {
  return get_number(box, tag, out);
}

int tlv_box_get_longlong(const tlv_box* box, uint16_t tag, int64_t* out) {
  return get_number(box, tag, out);
}

int tlv_box_get_float(const tlv_box* box, uint16_t tag, float* out) {
  return get_number(box, tag, out);
}

int tlv_box_get_double(const tlv_box* box, uint16_t tag, double* out) {
  return get_number(box, tag, out);
}

int tlv_box_get_bytes(const tlv_box* box, uint16_t tag, void* out, uint32_t* in_out_length) {
  const tlv_entry* const entry = find(box, tag);
  if (entry == nullptr || *in_out_length < entry->length) return -1;
  if (*in_out_length != 0) std::memset(out, 0, *in_out_length);
  *in_out_length = entry->length;
  if (entry->length != 0) std::memcpy(out, entry->value.data(), entry->length);
  return 0;
}

int tlv_box_get_string(const tlv_box* box, uint16_t tag, char* out, uint32_t* in_out_length) {
  return tlv_box_get_bytes(box, tag, out, in_out_length);
}

int tlv_box_get_bytes_ptr(const tlv_box* box, uint16_t tag, const uint8_t** out, uint32_t* out_length) {
  const tlv_entry* const entry = find(box, tag);
  if (entry == nullptr) return -1;
  *out = entry->value.data();
  *out_length = entry->length;
  return 0;
}

int tlv_box_get_object(const tlv_box* box, uint16_t tag, tlv_box** out) {
  *out = nullptr;
  const tlv_entry* const entry = find(box, tag);
  if (entry == nullptr) return -1;
  *out = tlv_box_parse(entry->value.data(), entry->length);
  return *out == nullptr ? -1 : 0;
}

}  // namespace keymaster
