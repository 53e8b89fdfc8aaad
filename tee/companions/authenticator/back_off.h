// How often a user's password was wrong in a row, and how long they must wait for the next attempt.
//
// A failure is on record before the password is looked at, and taken back once it proved right: whoever cuts the power
// in between has used up an attempt and not won one.
#ifndef TEE_COMPANIONS_AUTHENTICATOR_BACK_OFF_H_
#define TEE_COMPANIONS_AUTHENTICATOR_BACK_OFF_H_

#include <cstdint>

#include "tee_internal_api.h"

namespace keymaster::authenticator {

/// The object "pwauth.fail.<uid>": u32 count, u64 system time in milliseconds of the last failure, little-endian.
struct failure_record {
  uint32_t count = 0;
  uint64_t last_ms = 0;
};

/// wait_after answers how many milliseconds after the last of `count` failures in a row the next attempt is taken.
[[nodiscard]] uint64_t wait_after(uint32_t count);

/// One attempt of a user.
class attempt {
 public:
  /// begin puts a failure on record. TEE_ERROR_BUSY: it is too early, and `*wait_ms` tells for how long; nothing is put
  /// on record then. Otherwise the results of read_fixed and write_stored. The attempt is to be taken only after
  /// TEE_SUCCESS.
  [[nodiscard]] TEE_Result begin(uint32_t uid, uint32_t* wait_ms);

  /// proved_right ends a row of failures. The result of write_stored: the failure stays on record, so the password is
  /// not to count as right.
  [[nodiscard]] TEE_Result proved_right() const;

  /// gave_no_answer takes the failure back when it is the platform that failed. Should it fail at that too, the failure
  /// stays: that errs on the safe side.
  void gave_no_answer() const;

 private:
  uint32_t uid_ = 0;
  failure_record before_;
};

}  // namespace keymaster::authenticator

#endif  // TEE_COMPANIONS_AUTHENTICATOR_BACK_OFF_H_
