#include "soter/tlv_box.h"

#include <cstring>

#include "platform/trace.h"

namespace keymaster {
namespace {

// What the records take on the 32-bit processor that the messages speak of.
constexpr int box_size = 12;
constexpr int entry_size = 8;

constexpr uint32_t entry_header_size = 4;

void free_entry(void* value) {
  delete_record(static_cast<tlv_entry*>(value));
}

bool write_entry(byte_writer& out, const tlv_entry& entry) {
  return out.write_bytes(&entry.tag, sizeof entry.tag) && out.write_bytes(&entry.length, sizeof entry.length) &&
         out.write_bytes(entry.value.data(), entry.length);
}

}  // namespace

tlv_box* tlv_box_create() {
  auto* const box = new_record<tlv_box>();
  if (box == nullptr) {
    TRACE_ERROR("Out of memory, need %dB", box_size);
    return nullptr;
  }
  box->entries = key_list_create(free_entry);
  if (box->entries == nullptr) {
    delete_record(box);
    return nullptr;
  }
  return box;
}

bool tlv_read_entry(byte_reader& in, uint16_t& tag, std::span<const uint8_t>& value) {
  uint16_t length = 0;
  return in.copy_to(&tag, sizeof tag) && in.copy_to(&length, sizeof length) && in.read_bytes(length, value);
}

tlv_box* tlv_box_parse(const uint8_t* buffer, uint32_t length) {
  if (buffer == nullptr && length != 0) return nullptr;
  tlv_box_owner box{tlv_box_create()};
  if (!box) return nullptr;
  secret_bytes copy;
  if (!copy.copy_of({buffer, length})) {
    TRACE_ERROR("Out of memory, need %dB", length);
    return nullptr;
  }
  byte_reader in{copy.span()};
  while (in.remaining() != 0) {
    uint16_t tag = 0;
    std::span<const uint8_t> value;
    if (!tlv_read_entry(in, tag, value)) return nullptr;
    // A repeated tag is refused, and its first value stays; an entry that finds no memory is missed later.
    (void)tlv_box_putobject(box.get(), tag, value.data(), static_cast<uint32_t>(value.size()));
  }
  // Not before: a box that has its serialized form takes no entries.
  tlv_box* const parsed = box.release();
  parsed->buffer = std::move(copy);
  parsed->size = length;
  parsed->frozen = true;
  return parsed;
}

int tlv_box_destroy(tlv_box* box) {
  key_list_destroy(box->entries);
  delete_record(box);
  return 0;
}

const uint8_t* tlv_box_get_buffer(const tlv_box* box) {
  return box->buffer.data();
}

uint32_t tlv_box_get_size(const tlv_box* box) {
  return box->size;
}

int tlv_box_serialize(tlv_box* box) {
  if (box->frozen) return -1;
  secret_bytes buffer;
  if (!buffer.allocate(box->size)) {
    TRACE_ERROR("Out of memory, need %dB", box->size);
    return -1;
  }
  byte_writer out{buffer.span()};
  for (const key_list_node* node = box->entries->head; node != nullptr; node = node->next) {
    if (!write_entry(out, *static_cast<const tlv_entry*>(node->value))) return -1;
  }
  box->buffer = std::move(buffer);
  box->frozen = true;
  return 0;
}

int tlv_box_putobject(tlv_box* box, uint16_t tag, const void* value, uint32_t length) {
  if (box->frozen || length > tlv_longest_value || (value == nullptr && length != 0)) return -1;
  auto* const entry = new_record<tlv_entry>();
  if (entry == nullptr) {
    TRACE_ERROR("Out of memory, need %dB", entry_size);
    return -1;
  }
  entry->tag = tag;
  entry->length = static_cast<uint16_t>(length);
  constexpr uint32_t widest_get = sizeof(uint64_t);
  if (!entry->value.allocate(length < widest_get ? widest_get : length)) {
    TRACE_ERROR("Out of memory, need %dB", length);
    delete_record(entry);
    return -1;
  }
  if (length != 0) std::memcpy(entry->value.data(), value, length);
  if (key_list_add(box->entries, tag, entry) != 0) {
    delete_record(entry);
    return -1;
  }
  box->size += length + entry_header_size;
  return 0;
}

}  // namespace keymaster
