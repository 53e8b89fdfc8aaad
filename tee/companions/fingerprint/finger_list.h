// The enrolled fingers, in storage.
#ifndef TEE_COMPANIONS_FINGERPRINT_FINGER_LIST_H_
#define TEE_COMPANIONS_FINGERPRINT_FINGER_LIST_H_

#include <cstdint>
#include <span>

#include "platform/bytes.h"

namespace keymaster::fingerprint {

/// finger_list is the object "fp.templates":
///
///   offset  size   field
///        0  4      the highest finger id given so far, 0 before the first: ids are given in ascending order
///        4  12 n   the fingers in the order of enrolment: u32 finger id, u64 secure id of its user
///
/// All numbers are little-endian.
class finger_list {
 public:
  /// load reads the list; a device that has none has no fingers. TEE_ERROR_BAD_STATE, with a trace line: what is stored
  /// is no list; TEE_ERROR_OUT_OF_MEMORY; otherwise the platform's result. The list is empty then, and not to be used.
  [[nodiscard]] TEE_Result load();

  /// enrol adds a finger of the user and stores the list. TEE_ERROR_OVERFLOW: there are finger_limit of them, or all
  /// finger ids have been given; otherwise the platform's result. Nothing has changed in storage then.
  [[nodiscard]] TEE_Result enrol(uint64_t secure_id, uint32_t* finger);

  /// remove takes a finger out and stores the list. TEE_ERROR_ITEM_NOT_FOUND; otherwise the platform's result. Nothing
  /// has changed in storage then.
  [[nodiscard]] TEE_Result remove(uint32_t finger);

  /// find hands out the secure id of the finger's user. TEE_ERROR_ITEM_NOT_FOUND, with a trace line.
  [[nodiscard]] TEE_Result find(uint32_t finger, uint64_t* secure_id) const;

  /// records views the fingers as they are stored.
  [[nodiscard]] std::span<const uint8_t> records() const;

 private:
  [[nodiscard]] TEE_Result place_of(uint32_t finger, uint32_t* offset) const;
  [[nodiscard]] TEE_Result store() const;

  heap_bytes object_;  // as it is stored, with room for all fingers
  uint32_t size_ = 0;  // of what is stored
};

}  // namespace keymaster::fingerprint

#endif  // TEE_COMPANIONS_FINGERPRINT_FINGER_LIST_H_
