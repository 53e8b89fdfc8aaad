// The two clocks of a device.
#ifndef TEE_RUNTIME_CLOCKS_H_
#define TEE_RUNTIME_CLOCKS_H_

#include <cstdint>
#include <optional>

#include "tee_api_types.h"

namespace hosted_tee {

/// System time counts from the start of the secure world (which reads 2 hours, so that differences to a moment "an hour
/// ago" can be formed); REE time is the host's wall clock. A test can freeze and set either; a frozen clock stands
/// still until it is advanced or released.
class clocks {
 public:
  clocks();
  [[nodiscard]] TEE_Time system() const;
  [[nodiscard]] TEE_Time ree() const;

  void set_system(TEE_Time now) { frozen_system_ = now; }
  void set_ree(TEE_Time now) { frozen_ree_ = now; }
  /// system_is_frozen tells whether waiting would be in vain.
  [[nodiscard]] bool system_is_frozen() const { return frozen_system_.has_value(); }

  void release() { frozen_system_.reset(), frozen_ree_.reset(); }

  /// advance moves both clocks by `millis`; a running clock is frozen at its moved value first.
  void advance(std::uint64_t millis);

 private:
  std::uint64_t start_ms_;
  std::optional<TEE_Time> frozen_system_;
  std::optional<TEE_Time> frozen_ree_;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_CLOCKS_H_
