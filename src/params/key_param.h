// Parameter sets: what every key attribute, operation parameter and key characteristic travels in.
//
// A set owns its array of records and, for records of types KM_BIGNUM and KM_BYTES, a private heap copy of the bytes.
// Whether a set holds anything is told by `params`; `length` may be stale once the array is gone.
#ifndef KEYMASTER_PARAMS_KEY_PARAM_H_
#define KEYMASTER_PARAMS_KEY_PARAM_H_

#include <cstddef>
#include <cstdint>
#include <span>

#include "params/keymaster_defs.h"

namespace keymaster {

/// A reference to bytes, in the two 8-byte slots of a record. On a 32-bit processor the pointer fills half of its slot;
/// only the low 32 bits of the length slot count.
struct keymaster_blob_t {
  union {
    uint8_t* data;
    uint64_t data_slot;
  };
  uint32_t data_length;
  uint32_t unused;
};

/// One tagged value. The layout is that of the marshalled record on every processor, so that a record is copied whole.
struct keymaster_key_param_t {
  keymaster_tag_t tag;
  uint32_t gap;  // keeps the value 8-byte aligned; carried along as the client gave it
  union {
    uint32_t enumerated;
    uint8_t boolean;  // a byte and not a bool: a client may send any value
    uint32_t integer;
    uint64_t long_integer;
    uint64_t date_time;  // milliseconds since 1970
    keymaster_blob_t blob;
  };
};

static_assert(sizeof(keymaster_blob_t) == 16 && offsetof(keymaster_blob_t, data_length) == 8);
static_assert(sizeof(keymaster_key_param_t) == 24 && alignof(keymaster_key_param_t) == 8);
static_assert(offsetof(keymaster_key_param_t, enumerated) == 8);
static_assert(offsetof(keymaster_key_param_t, blob) == 8);

/// A counted array of parameters.
struct keymaster_key_param_set_t {
  keymaster_key_param_t* params = nullptr;
  uint32_t length = 0;
};

/// keymaster_tag_get_type answers the type bits of a tag, which need not be one of the known types.
[[nodiscard]] constexpr uint32_t keymaster_tag_get_type(keymaster_tag_t tag) {
  return tag & 0xF0000000;
}

/// tag_has_blob tells whether a tag's value is a blob.
[[nodiscard]] constexpr bool tag_has_blob(keymaster_tag_t tag) {
  return keymaster_tag_get_type(tag) == KM_BIGNUM || keymaster_tag_get_type(tag) == KM_BYTES;
}

/// records views the parameters of a set; a set without an array has none, whatever its length says.
[[nodiscard]] std::span<keymaster_key_param_t> records(const keymaster_key_param_set_t& set);

/// blob_bytes views the bytes of a blob parameter.
[[nodiscard]] std::span<const uint8_t> blob_bytes(const keymaster_key_param_t& param);

/// key_param_set_count_tag counts the parameters with exactly this tag (type and number).
[[nodiscard]] uint32_t key_param_set_count_tag(const keymaster_key_param_set_t& set, keymaster_tag_t tag);

/// key_param_set_contains tells whether the tag occurs at all.
[[nodiscard]] bool key_param_set_contains(const keymaster_key_param_set_t& set, keymaster_tag_t tag);

/// key_param_set_at_most_one tells whether the tag is absent or occurs once.
[[nodiscard]] bool key_param_set_at_most_one(const keymaster_key_param_set_t& set, keymaster_tag_t tag);

/// key_param_set_get_unique answers the one parameter with this tag; null when it is absent or repeated, so that a
/// repeated tag counts as missing.
[[nodiscard]] const keymaster_key_param_t* key_param_set_get_unique(const keymaster_key_param_set_t& set,
                                                                    keymaster_tag_t tag);

/// key_param_set_find_next answers the next parameter with this tag behind `previous` (null: from the start), or null.
[[nodiscard]] const keymaster_key_param_t* key_param_set_find_next(const keymaster_key_param_set_t& set,
                                                                   keymaster_tag_t tag,
                                                                   const keymaster_key_param_t* previous);

/// key_param_set_append adds a copy of `parameter`, whose blob (if it has one) the set owns from then on in either
/// case. KM_ERROR_MEMORY_ALLOCATION_FAILED: the set is unchanged and the blob has been freed. Pointers into the set's
/// array are invalid afterwards; `parameter` may be one of them if it has no blob.
[[nodiscard]] keymaster_error_t key_param_set_append(keymaster_key_param_set_t* set,
                                                     const keymaster_key_param_t& parameter);

/// keymaster_free_param_array wipes and frees the blobs of `length` records; the array stays.
void keymaster_free_param_array(keymaster_key_param_t* params, uint32_t length);

/// keymaster_free_param_set frees the blobs and the array and sets `params` to null. `length` is left as it was:
/// callers test `params`. Freeing twice is harmless.
void keymaster_free_param_set(keymaster_key_param_set_t* set);

/// Makers of parameters.
[[nodiscard]] keymaster_key_param_t integer_param(keymaster_tag_t tag, uint32_t value);
[[nodiscard]] keymaster_key_param_t long_param(keymaster_tag_t tag, uint64_t value);

/// parameter_set is the owner of a set.
class parameter_set : public keymaster_key_param_set_t {
 public:
  parameter_set() = default;
  parameter_set(parameter_set&& other) noexcept : keymaster_key_param_set_t(other.release()) {}
  parameter_set& operator=(parameter_set&& other) noexcept {
    if (this != &other) {
      reset();
      static_cast<keymaster_key_param_set_t&>(*this) = other.release();
    }
    return *this;
  }
  parameter_set(const parameter_set&) = delete;
  parameter_set& operator=(const parameter_set&) = delete;
  ~parameter_set() { reset(); }

  void reset() {
    keymaster_free_param_set(this);
    length = 0;
  }
  /// release hands the content on; this set is empty afterwards.
  [[nodiscard]] keymaster_key_param_set_t release() {
    const keymaster_key_param_set_t content = *this;
    params = nullptr;
    length = 0;
    return content;
  }
};

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_KEY_PARAM_H_
