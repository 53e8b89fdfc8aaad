// TLV boxes: how the provisioning TA stores keys and properties.
//
//   offset  size    field
//        0  2       tag, little-endian
//        2  2       length of the value, little-endian
//        4  length  value
//
// Entries follow each other without padding; there is no header and no trailer. A box that is built from entries
// serializes in the reverse order of the puts. A tag occurs once: the first entry of a tag stays.
//
// Results are 0 and -1. Once a box has its serialized form it is frozen: it takes no more entries.
#ifndef KEYMASTER_SOTER_TLV_BOX_H_
#define KEYMASTER_SOTER_TLV_BOX_H_

#include <cstdint>
#include <span>
#include <utility>

#include "platform/bytes.h"
#include "platform/cursor.h"
#include "soter/key_list.h"

namespace keymaster {

/// The longest value of an entry.
inline constexpr uint32_t tlv_longest_value = 0xFFFF;

struct tlv_entry {
  uint16_t tag = 0;
  uint16_t length = 0;
  secret_bytes value;  // at least 8 bytes, zero behind the value: the gets of fixed width may reach beyond it
};

struct tlv_box {
  key_list* entries = nullptr;
  secret_bytes buffer;  // the serialized form of a frozen box
  uint32_t size = 0;    // of the serialized form, whether it is there or not
  bool frozen = false;
};

/// tlv_box_create makes an empty box. Null: out of memory.
[[nodiscard]] tlv_box* tlv_box_create();

/// tlv_box_parse makes a frozen box of `length` serialized bytes, which it copies; of an entry that is repeated it
/// keeps the first. Null: out of memory, bytes that end within an entry, or no `buffer` for a `length` above 0.
[[nodiscard]] tlv_box* tlv_box_parse(const uint8_t* buffer, uint32_t length);

/// tlv_read_entry takes the next entry of serialized bytes, its value as a view, and allocates nothing. False: they end
/// within the entry, and `in` stands somewhere in it.
[[nodiscard]] bool tlv_read_entry(byte_reader& in, uint16_t& tag, std::span<const uint8_t>& value);

/// tlv_box_destroy wipes and frees the box with all that it holds. Always 0.
int tlv_box_destroy(tlv_box* box);

/// tlv_box_get_buffer answers the serialized form, which stays the box's; null before there is one. tlv_box_get_size
/// answers its size.
[[nodiscard]] const uint8_t* tlv_box_get_buffer(const tlv_box* box);
[[nodiscard]] uint32_t tlv_box_get_size(const tlv_box* box);

/// tlv_box_serialize freezes the box and makes its serialized form. -1: frozen already, or out of memory.
[[nodiscard]] int tlv_box_serialize(tlv_box* box);

/// tlv_box_putobject adds an entry with a copy of the value. Every other put goes through it. -1: the box is frozen,
/// has the tag already, or the value is longer than an entry can be (or null with a length); or out of memory.
[[nodiscard]] int tlv_box_putobject(tlv_box* box, uint16_t tag, const void* value, uint32_t length);

/// The puts of a fixed width store the number as the processor has it. A string is stored with its NUL, and an object
/// as its serialized form: -1 when it has none.
[[nodiscard]] int tlv_box_put_char(tlv_box* box, uint16_t tag, int8_t value);
[[nodiscard]] int tlv_box_put_short(tlv_box* box, uint16_t tag, int16_t value);
[[nodiscard]] int tlv_box_put_int(tlv_box* box, uint16_t tag, int32_t value);
[[nodiscard]] int tlv_box_put_long(tlv_box* box, uint16_t tag, int32_t value);
[[nodiscard]] int tlv_box_put_longlong(tlv_box* box, uint16_t tag, int64_t value);
[[nodiscard]] int tlv_box_put_float(tlv_box* box, uint16_t tag, float value);
[[nodiscard]] int tlv_box_put_double(tlv_box* box, uint16_t tag, double value);
[[nodiscard]] int tlv_box_put_string(tlv_box* box, uint16_t tag, const char* value);
[[nodiscard]] int tlv_box_put_bytes(tlv_box* box, uint16_t tag, const void* bytes, uint32_t length);
[[nodiscard]] int tlv_box_put_object(tlv_box* box, uint16_t tag, const tlv_box* other);

/// The gets of a fixed width copy that width from the start of the value, whatever the value's length: what lies behind
/// the value is zero. -1: no such tag, and `*out` stays as it was.
[[nodiscard]] int tlv_box_get_char(const tlv_box* box, uint16_t tag, int8_t* out);
[[nodiscard]] int tlv_box_get_short(const tlv_box* box, uint16_t tag, int16_t* out);
[[nodiscard]] int tlv_box_get_int(const tlv_box* box, uint16_t tag, int32_t* out);
[[nodiscard]] int tlv_box_get_long(const tlv_box* box, uint16_t tag, int32_t* out);
[[nodiscard]] int tlv_box_get_longlong(const tlv_box* box, uint16_t tag, int64_t* out);
[[nodiscard]] int tlv_box_get_float(const tlv_box* box, uint16_t tag, float* out);
[[nodiscard]] int tlv_box_get_double(const tlv_box* box, uint16_t tag, double* out);

/// tlv_box_get_bytes fills `out` with the value and zeros up to `*in_out_length`, which becomes the value's length. -1:
/// no such tag, or the value is longer than that; nothing is written then. tlv_box_get_string does the same and adds no
/// NUL.
[[nodiscard]] int tlv_box_get_bytes(const tlv_box* box, uint16_t tag, void* out, uint32_t* in_out_length);
[[nodiscard]] int tlv_box_get_string(const tlv_box* box, uint16_t tag, char* out, uint32_t* in_out_length);

/// tlv_box_get_bytes_ptr shows the value in place; it is valid as long as the box. -1: no such tag.
[[nodiscard]] int tlv_box_get_bytes_ptr(const tlv_box* box, uint16_t tag, const uint8_t** out, uint32_t* out_length);

/// tlv_box_get_object parses the value as a box, which is the caller's to destroy. -1: no such tag, or tlv_box_parse
/// makes none of it; `*out` is null then.
[[nodiscard]] int tlv_box_get_object(const tlv_box* box, uint16_t tag, tlv_box** out);

/// tlv_box_owner destroys the box that it holds.
class tlv_box_owner {
 public:
  explicit tlv_box_owner(tlv_box* box = nullptr) : box_(box) {}
  tlv_box_owner(tlv_box_owner&& other) noexcept : box_(std::exchange(other.box_, nullptr)) {}
  tlv_box_owner& operator=(tlv_box_owner&& other) noexcept {
    if (this != &other) reset(std::exchange(other.box_, nullptr));
    return *this;
  }
  tlv_box_owner(const tlv_box_owner&) = delete;
  tlv_box_owner& operator=(const tlv_box_owner&) = delete;
  ~tlv_box_owner() { reset(); }

  void reset(tlv_box* box = nullptr) {
    tlv_box* const old = std::exchange(box_, box);
    if (old != nullptr) tlv_box_destroy(old);
  }
  [[nodiscard]] tlv_box* release() { return std::exchange(box_, nullptr); }
  [[nodiscard]] tlv_box* get() const { return box_; }
  [[nodiscard]] explicit operator bool() const { return box_ != nullptr; }

 private:
  tlv_box* box_;
};

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_TLV_BOX_H_
